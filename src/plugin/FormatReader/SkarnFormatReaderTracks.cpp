// Building a format reader's tracks from a clip: video (timing, start frame,
// cadence, format description), timecode, and one track per audio channel.
#include "SkarnFormatReader.h"

#include "CMBlockBuffer.h"
#include "CoreAudioTypes.h"
#include "FileSystem.h"
#include "SkarnCadenceReading.h"
#include "SkarnClip.h"
#include "SkarnFormatReaderInternal.h"
#include "SkarnLog.h"

#include <cmath>
#include <fcntl.h>
#include <unistd.h>

using namespace SkarnFormatReaderDetail;

namespace {

// Audio samples are grouped in chunks of at most this many bytes.
constexpr int64_t kMaxAudioChunkBytes = 2097152;

int64_t saturatingFrames(double frames) {
    if (!(frames > 0)) return 0;
    if (frames >= 9.0e18) return INT64_MAX / 4;
    return int64_t(frames);
}

CMTime scaledTimes(CMTime duration, int64_t count) {
    if (!CMTIME_IS_NUMERIC(duration) || duration.value == 0) return CMTimeMake(0, duration.timescale > 0 ? duration.timescale : 1);
    int64_t value = 0;
    if (__builtin_mul_overflow(duration.value, count, &value)) return kCMTimePositiveInfinity;
    return CMTimeMake(value, duration.timescale);
}

std::optional<int64_t> integerAt(SkarnClip* clip, const std::string& xpath) {
    auto text = clip->stringFromClipDescriptionForXPath(xpath);
    if (!text || text->empty()) return std::nullopt;
    return stringIntegerValue(*text);
}

}  // namespace

struct SkarnFormatReader::Builder {
    SkarnFormatReader* reader = nullptr;
    SkarnClip* clip = nullptr;
    bool feedOriginalFrames = false;
    bool keepingMediaRate = false;

    int64_t frameCount = 0;
    std::optional<std::string> videoPath;
    Ref<SkarnTrackReader> video;
    std::optional<std::string> frameRateText;
    bool cadenceBranch = false;  // a frame-rate row whose cadence the reader removes
    SkarnCadenceReading cadence;
    double audioTimingOffsetSeconds = 0;
    double videoTimingOffsetSeconds = 0;
    int64_t keptFrames = 0;
    CMTime videoDuration = kCMTimeZero;

    void buildVideoTrack();
    void readFrameRate();
    void readStartFrame();
    void readCadence();
    int32_t probeFrame(uint64_t index, int fd, bool* dropped, uint32_t* sequence);
    void applyActiveRate();
    void finishVideoTrack();
    void buildTimecodeTrack();
    void buildAudioTracks();
    Ref<SkarnTrackReader> audioTrack(size_t channel);
};

Ref<SkarnFormatReader> SkarnFormatReader::formatReaderWithClip(SkarnClip* clip, bool feedOriginalFrames,
                                                               bool keepingMediaRate) {
    return initWithClip(clip, feedOriginalFrames, keepingMediaRate);
}

Ref<SkarnFormatReader> SkarnFormatReader::initWithClip(SkarnClip* clip, bool feedOriginalFrames,
                                                       bool keepingMediaRate) {
    if (!clip) return nullptr;
    Ref<SkarnFormatReader> reader(new SkarnFormatReader);
    SkarnLog(8, "%@ init", reader->Object::description());
    Builder b;
    b.reader = reader.get();
    b.clip = clip;
    b.feedOriginalFrames = feedOriginalFrames;
    b.keepingMediaRate = keepingMediaRate;
    b.frameCount = saturatingFrames(clip->durationNumber().value_or(0));
    b.videoPath = clip->videoFilePath();
    b.buildVideoTrack();
    b.buildTimecodeTrack();
    b.buildAudioTracks();
    return reader;
}

// ---------------------------------------------------------------------------
// Video

void SkarnFormatReader::Builder::buildVideoTrack() {
    video = SkarnTrackReader::trackReaderWithFormatReader(reader);
    video->setMediaType(kCMMediaType_Video);
    video->setUrl(videoPath);
    if (clip->isMXFOp1bFormat()) {
        reader->_mxfDataObject = mxfDataObject::initWithPath(videoPath);
        video->setMxfDataAccess(reader->_mxfDataObject.get());
        // The cursors find an MXF track's samples in the index tables, and
        // stop the process when the track claims frames the tables do not
        // hold: a damaged or cut file (or a clip length that lies) is read as
        // long as its index.
        uint32_t indexed = 0;
        reader->_mxfDataObject->getVideoFrameCount(&indexed);
        if (int64_t(indexed) != frameCount) {
            SkarnLog(2, "%@: the MXF index holds %u frames, the clip says %lld", reader, indexed, frameCount);
            frameCount = int64_t(indexed);
        }
    }
    video->setDataOffset(saturatingFrames(clip->startByteOffset()));
    video->setDataLength(saturatingFrames(clip->videoDataSize()));
    if (frameCount != 0) video->setSampleSize(video->dataLength() / frameCount);
    video->setSampleRate(clip->frameRate());
    video->setCodec(clip->sourceFormat());
    video->setAnamorphic(clip->anamorphic());
    video->setIsDropFrame(clip->isDropFrame());
    video->setUneditedNumDataBytes(regularFileSize(videoPath));
    // One frame per chunk: hosts asking for chunk details of a video track get single frames.
    video->setSamplesPerChunk(1);
    video->setChunkSize(video->sampleSize());

    readFrameRate();
    readStartFrame();
    readCadence();
    applyActiveRate();
    finishVideoTrack();
    reader->setTrackList({video});
}

void SkarnFormatReader::Builder::readFrameRate() {
    frameRateText = clip->stringFromClipDescriptionForXPath("ClipContent/EssenceList/Video/FrameRate");
    if (!frameRateText || frameRateText->empty())
        frameRateText = clip->stringFromClipDescriptionForXPath("ClipContent/Essence/Video/FrameRate");
    const FrameRateRow* row = frameRateRowForText(frameRateText.value_or(""));
    if (!row) {
        SkarnLog(2, "%@: we don't understand this framerate: %@", reader, frameRateText);
        return;
    }
    video->setFrameDuration(CMTimeMake(row->value, row->timescale));
    video->setFrameQuanta(row->frameQuanta);
    cadenceBranch = row->readsCadence;
}

void SkarnFormatReader::Builder::readStartFrame() {
    Ref<SkarnVestaTimecode> start = clip->__mediaStart();
    video->setSampleOffset(0);
    if (!start) return;
    double frames = start->nativeFramecountWithDropAdjust(true, true);
    video->setTimecodeStart(std::isfinite(frames) ? int64_t(frames) : 0);
}

int32_t SkarnFormatReader::Builder::probeFrame(uint64_t index, int fd, bool* dropped, uint32_t* sequence) {
    if (fd < 0) return -50;
    int64_t size = video->sampleSize();
    if (size <= 0 || size > (int64_t(64) << 20)) return -19;
    Ref<CMBlockBuffer> block;
    OSStatus status = CMBlockBufferCreateWithMemoryBlock(kCFAllocatorDefault, nullptr, size_t(size),
                                                         kCFAllocatorDefault, nullptr, 0, size_t(size),
                                                         kCMBlockBufferAssureMemoryNowFlag, &block);
    if (status != 0) return status;
    char* data = nullptr;
    status = CMBlockBufferGetDataPointer(block, 0, nullptr, nullptr, &data);
    if (status != 0) return status;
    int64_t offset = video->dataOffset() + int64_t(video->sampleOffset() + index) * size;
    if (FileSystem::preadFully(fd, data, size_t(size), offset) != size) return -19;
    uint8_t droppedByte = 0;
    status = SkarnAnalyzePulldown(block, video->codec(), nullptr, int32_t(clip->shootingRate()), &droppedByte, sequence);
    *dropped = droppedByte != 0;
    return status;
}

void SkarnFormatReader::Builder::readCadence() {
    uint64_t quanta = video->frameQuanta();
    uint32_t shooting = uint32_t(std::max(0.0, std::min(clip->shootingRate(), 1000.0)));
    if (!cadenceBranch || feedOriginalFrames || keepingMediaRate) return;
    if (!(quanta == 2ull * shooting || (shooting == 24 && quanta == 30))) return;

    int fd = FileSystem::openRegularFileReadOnly(videoPath.value_or(""));
    uint64_t next = 0;
    auto pull = [&](bool* delivered, bool* dropped, uint32_t* sequence) -> int32_t {
        // The essence ends the reading: never probe past the clip's frames.
        if (next >= uint64_t(frameCount)) return -19;
        bool isDropped = false;
        int32_t status = probeFrame(next++, fd, &isDropped, sequence);
        if (status != 0) {
            SkarnLog(16, "no video frame");
            return status;
        }
        *dropped = isDropped;
        *delivered = !isDropped;
        return 0;
    };
    cadence = SkarnReadCadence(uint32_t(quanta), shooting, video->codec(), 16, pull);
    if (fd >= 0) ::close(fd);
    if (!cadence.cadence) return;

    const SkarnCadence& row = *cadence.cadence;
    double frameSeconds = CMTimeGetSeconds(video->frameDuration());
    if (!std::isfinite(frameSeconds)) frameSeconds = 0;
    // The frame shift is how much later than its kept place on the shooting-rate
    // timeline the cadence's first frame (position 0) was recorded. The kept
    // frames are presented without gaps from time 0, so the sound recorded with
    // a presented time t starts at t + shift: audio positions move by the shift,
    // earlier for a negative one. (The ingest pipeline delays stamps instead,
    // which turns the sign of its audio offset round and puts positive shifts
    // on its video; here the video keeps its times and only the audio moves.)
    audioTimingOffsetSeconds = frameSeconds * row.frameShift;
    SkarnLog(16, "cadence = 0x%x, video frame shift = %lf, audio timing offset = %lf, video timing offset = %lf",
             row.pattern, row.frameShift, audioTimingOffsetSeconds, videoTimingOffsetSeconds);

    auto keepDrop = SkarnCadenceKeepDrop(row.recording);
    video->setPulldownPattern(keepDrop.data());
    video->setFollowonDropSequence(SkarnCadenceDropSequence(row.recording).data());
    video->setPatternLength(keepDrop.size());
    video->setPatternIndex(row.index);
    uint64_t active = 0;
    for (uint8_t keep : keepDrop) active += keep;
    video->setNumActiveFramesInPattern(active);
    // Whole frames, and none: the kept frames keep their places.
    video->setTimingOffset(0);

    // Frames kept from the clip's first frame on, counted over whole
    // repetitions of the cadence and then the last partial one.
    uint64_t length = keepDrop.size();
    uint64_t repetitions = uint64_t(frameCount) / length;
    keptFrames = int64_t(repetitions * active);
    for (uint64_t i = 0; i < uint64_t(frameCount) % length; ++i) keptFrames += keepDrop[(row.index + i) % length];
}

void SkarnFormatReader::Builder::applyActiveRate() {
    if (!video->pulldownPattern()) return;
    CMTime frameDuration = video->frameDuration();
    uint32_t shooting = uint32_t(clip->shootingRate());
    uint64_t quanta = video->frameQuanta();
    int32_t timescale = 0;
    if (shooting == 24) {
        timescale = frameDuration.timescale == 6000 ? 2400 : 24000;
        SkarnLog(2, "TS Sample Rate now = %d because 24 FPS", timescale);
    } else if (shooting == 25 && quanta == 50) {
        timescale = 2500;
        SkarnLog(2, "TS Sample Rate now = %d because 25 FPS shot at 50 FPS", timescale);
    } else if (shooting == 30 && quanta == 60) {
        timescale = 30000;
        SkarnLog(2, "TS Sample Rate now = %d because 30 FPS shot at 60 FPS", timescale);
    }
    if (timescale != 0) video->setFrameDuration(CMTimeMake(frameDuration.value, timescale));
    // The start timecode now counts frames at the shooting rate.
    if (Ref<SkarnVestaTimecode> tc = SkarnVestaTimecode::timecodeWithFramecount(
            video->timecodeStart(), double(quanta), double(shooting), 0, clip->timecodeFormat())) {
        double frames = tc->interpFramecountWithDropAdjust(false, false);
        if (std::isfinite(frames)) video->setTimecodeStart(int64_t(frames));
    }
}

void SkarnFormatReader::Builder::finishVideoTrack() {
    FormatDescriptionChoice choice = chooseVideoFormatDescription(reader, clip, video.get(), frameRateText);
    CMFormatDescriptionRef desc;
    if (CMVideoFormatDescriptionCreate(kCFAllocatorDefault, choice.codecType, choice.width, choice.height,
                                       &choice.extensions, &desc) == 0)
        video->setFormatDesc(desc);

    CMTime frameDuration = video->frameDuration();
    int64_t frames = video->pulldownPattern() ? keptFrames : frameCount;
    videoDuration = scaledTimes(frameDuration, frames);
    video->setTrackDuration(videoDuration);
    if (frames > 0 && frameDuration.value > 0) {
        video->setMinpts(CMTimeMake(0, frameDuration.timescale));
        video->setMaxpts(scaledTimes(frameDuration, frames - 1));
    } else if (frames > 0) {
        // A rate that is not understood: one place, time 0, to stand on.
        video->setMinpts(kCMTimeZero);
        video->setMaxpts(kCMTimeZero);
    }
    // An empty track keeps invalid first and last times: its cursors have no
    // valid stamps, which tells readers there is nothing to read.
    CMTimeRange whole = CMTimeRangeMake(video->minpts(), videoDuration);
    video->setTrackEdit(CMTimeMappingMake(whole, whole));
    SkarnLog(2, "%@: created video track: %@", reader, video);
}

// ---------------------------------------------------------------------------
// Timecode

void SkarnFormatReader::Builder::buildTimecodeTrack() {
    Ref<SkarnTrackReader> timecode = video->copyWithZone();
    timecode->setMediaType(kCMMediaType_TimeCode);
    CMFormatDescriptionRef desc;
    if (CMTimeCodeFormatDescriptionCreate(kCFAllocatorDefault, kCMTimeCodeFormatType_Counter32,
                                          video->frameDuration(), uint32_t(video->frameQuanta()),
                                          video->isDropFrame() ? uint32_t(kCMTimeCodeFlag_DropFrame) : 0u, nullptr, &desc) == 0)
        timecode->setFormatDesc(desc);
    auto tracks = reader->trackList();
    tracks.push_back(timecode);
    reader->setTrackList(std::move(tracks));
}

// ---------------------------------------------------------------------------
// Audio

Ref<SkarnTrackReader> SkarnFormatReader::Builder::audioTrack(size_t channel) {
    Ref<SkarnTrackReader> audio = SkarnTrackReader::trackReaderWithFormatReader(reader);
    audio->setMediaType(kCMMediaType_Audio);
    // XPath counts channels from 1.
    std::string base = "ClipContent/EssenceList/Audio[" + std::to_string(channel + 1) + "]/";
    mxfDataObject* mxf = reader->_mxfDataObject.get();
    std::optional<int64_t> dataSize = integerAt(clip, base + "AudioIndex/DataSize");
    std::optional<int64_t> startOffset = integerAt(clip, base + "AudioIndex/StartByteOffset");
    std::optional<int64_t> bits = integerAt(clip, base + "BitsPerSample");
    if (!bits) bits = integerAt(clip, "ClipContent/EssenceList/Audio/BitsPerSample");
    std::optional<int64_t> rate = integerAt(clip, base + "SamplingRate");
    if (!rate) rate = integerAt(clip, "ClipContent/EssenceList/Audio/SamplingRate");
    // A self-contained clip's header XML has no per-channel entries: its MXF
    // header describes the sound.
    if (mxf && (!bits || *bits <= 0)) bits = int64_t(mxf->audioBytesPerSample()) * 8;
    if (mxf && (!rate || *rate <= 0)) rate = int64_t(mxf->audioSamplingRate());
    int64_t bitsPerSample = bits.value_or(0);
    if (bitsPerSample != 16 && bitsPerSample != 24) bitsPerSample = bitsPerSample > 16 ? 24 : 16;
    int64_t sampleRate = rate.value_or(0);
    if (sampleRate <= 0 || sampleRate > 1000000) sampleRate = 48000;
    int64_t sampleSize = bitsPerSample / 8;

    audio->setSampleSize(sampleSize);
    audio->setSampleRate(double(sampleRate));
    audio->setCodec(bitsPerSample == 24 ? FourCharCode(FourCC("in24")) : FourCharCode(FourCC("sowt")));
    audio->setDataOffset(std::max<int64_t>(0, startOffset.value_or(0)));
    if (mxf) {
        audio->setUrl(videoPath);
        audio->setMxfDataAccess(mxf);
        audio->setAudioChannelIndex(channel);
        uint64_t chunkSize = 0, dataLength = 0;
        mxf->getAudioChunkSize(&chunkSize, &dataLength);
        audio->setDataLength(int64_t(std::min<uint64_t>(dataLength, INT64_MAX)));
        audio->setChunkSize(int64_t(std::min<uint64_t>(chunkSize, INT64_MAX)));
        audio->setSamplesPerChunk(std::max<int64_t>(1, int64_t(chunkSize) / sampleSize));
    } else {
        auto paths = clip->audioFilePaths();
        if (paths && channel < paths->size()) audio->setUrl((*paths)[channel]);
        int64_t length = std::max<int64_t>(0, dataSize.value_or(0));
        audio->setDataLength(length);
        int64_t samples = length / sampleSize;
        int64_t perChunk = kMaxAudioChunkBytes / sampleSize;
        audio->setSamplesPerChunk(samples > perChunk ? perChunk : std::max<int64_t>(1, samples));
        audio->setChunkSize(audio->samplesPerChunk() * sampleSize);
    }
    audio->setUneditedNumDataBytes(regularFileSize(audio->url()));
    // In samples, half away from zero; a negative offset is kept in two's
    // complement, which the cursors read back as the signed number it is.
    audio->setTimingOffset(uint64_t(int64_t(std::llround(audioTimingOffsetSeconds * double(sampleRate)))));

    // A channel without data (no DataSize, or 0) has no samples at all.
    bool hasData = mxf != nullptr || audio->dataLength() > 0;
    CMTime duration = hasData ? CMTimeConvertScale(videoDuration, int32_t(sampleRate),
                                                   kCMTimeRoundingMethod_RoundAwayFromZero)
                              : CMTimeMake(0, int32_t(sampleRate));
    if (!CMTIME_IS_NUMERIC(duration)) duration = CMTimeMake(0, int32_t(sampleRate));
    CMTime oneSample = CMTimeMake(1, int32_t(sampleRate));
    audio->setTrackDuration(duration);
    audio->setFrameDuration(oneSample);
    if (duration.value > 0) {
        audio->setMinpts(CMTimeMake(0, int32_t(sampleRate)));
        audio->setMaxpts(CMTimeSubtract(duration, oneSample));
    }
    CMTimeRange whole = CMTimeRangeMake(audio->minpts(), duration);
    audio->setTrackEdit(CMTimeMappingMake(whole, whole));

    AudioStreamBasicDescription asbd{};
    asbd.mSampleRate = double(sampleRate);
    asbd.mFormatID = kAudioFormatLinearPCM;
    asbd.mFormatFlags = kAudioFormatFlagIsSignedInteger | kAudioFormatFlagIsPacked;
    asbd.mBytesPerPacket = uint32_t(sampleSize);
    asbd.mFramesPerPacket = 1;
    asbd.mBytesPerFrame = uint32_t(sampleSize);
    asbd.mChannelsPerFrame = 1;
    asbd.mBitsPerChannel = uint32_t(bitsPerSample);
    AudioChannelLayout layout{};
    layout.mChannelLayoutTag = kAudioChannelLayoutTag_UseChannelDescriptions;
    layout.mNumberChannelDescriptions = 1;
    layout.mChannelDescriptions[0].mChannelLabel = kAudioChannelLabel_Discrete_0 + uint32_t(channel);
    CMFormatDescriptionRef desc;
    if (CMAudioFormatDescriptionCreate(kCFAllocatorDefault, &asbd, sizeof layout, &layout, 0, nullptr, nullptr,
                                       &desc) == 0)
        audio->setFormatDesc(desc);
    else
        SkarnLog(2, "SkarnAudioFormatDescription: bad asbd");
    return audio;
}

void SkarnFormatReader::Builder::buildAudioTracks() {
    size_t channels = 0;
    if (reader->_mxfDataObject) {
        channels = reader->_mxfDataObject->getAudioChannelCount();
    } else if (auto paths = clip->audioFilePaths()) {
        channels = paths->size();
    }
    // A channel count read from a damaged header is no reason to make
    // millions of tracks.
    channels = std::min<size_t>(channels, 64);
    auto tracks = reader->trackList();
    for (size_t channel = 0; channel < channels; ++channel) tracks.push_back(audioTrack(channel));
    reader->setTrackList(std::move(tracks));
}
