// Clip ingest: the delivered records turned into packets. Frames and audio
// blocks are wrapped, not copied; the wrapper hands the memory back to the
// plug-in's buffer manager when the last packet made from it is written.
#include "ClipIngest.h"

#include "ByteReader.h"
#include "CMFormatDescriptionBridge.h"
#include "CoreAudioTypes.h"
#include "H264Sample.h"
#include "TimecodeLabel.h"

extern "C" {
#include <libavcodec/codec_par.h>
#include <libavcodec/defs.h>
#include <libavutil/buffer.h>
#include <libavutil/macros.h>
#include <libavutil/mathematics.h>
}

#include <cstring>
#include <new>
#include <numeric>

namespace {

// Frames held before the movie starts: enough to see how far a long-GOP
// stream reorders, or to find its parameter sets.
constexpr size_t kLookahead = 16;
// Audio formats are learnt from the first call; a clip that says it has
// audio but gives none starts its movie without waiting longer than this.
constexpr size_t kFramesBeforeAudio = 8;
// Channels a record may list.
constexpr unsigned kMaxChannels = 64;

struct GiveBack {
    VestaKilnVideoBufferManager* video = nullptr;
    VestaKilnAudioBufferManager* audio = nullptr;
    uint64_t size = 0;
    void* refCon2 = nullptr;
};

void giveBack(void* opaque, uint8_t* data) {
    auto* g = static_cast<GiveBack*>(opaque);
    if (g->video) g->video->disposeVideoMedia(data, g->size, g->refCon2);
    if (g->audio) g->audio->disposeAudioMedia(data, g->size, g->refCon2);
    delete g;
}

// The delivered memory as a reference-counted buffer; when that cannot be
// made, the memory goes back at once and nullptr is answered.
AVBufferRef* wrapDelivered(uint8_t* data, size_t size, const GiveBack& owner) {
    auto* g = new (std::nothrow) GiveBack(owner);
    AVBufferRef* ref = g ? av_buffer_create(data, size, giveBack, g, 0) : nullptr;
    if (!ref) {
        delete g;
        if (owner.video) owner.video->disposeVideoMedia(data, owner.size, owner.refCon2);
        if (owner.audio) owner.audio->disposeAudioMedia(data, owner.size, owner.refCon2);
    }
    return ref;
}

uint32_t fourCharTag(FourCharCode code) {
    return MKTAG(char(code >> 24), char(code >> 16), char(code >> 8), char(code));
}

std::string fourCharText(FourCharCode code) {
    std::string s;
    for (int shift = 24; shift >= 0; shift -= 8) {
        char c = char(code >> shift);
        s += c >= 32 && c < 127 ? c : '?';
    }
    return s;
}

bool isDV(FourCharCode type) { return (type >> 16) == (('d' << 8) | 'v'); }
bool isH264(FourCharCode type) {
    return type == FourCC("avc1") || type == FourCC("avlg") || (type >> 16) == (('a' << 8) | 'i');
}

}  // namespace

void ClipIngest::takeVideo(const VestaKilnPlugInMediaSpecifier_Deprecated& m, std::optional<Frame>* out) {
    if (!m.videoData) return;
    Frame f;
    f.buffer = wrapDelivered(m.videoData, m.videoDataSize, {m.videoBufferManager, nullptr, m.videoDataSize,
                                                            m.videoMediaDisposeRefCon2});
    if (!f.buffer) {
        fail(_lastCardIndex + 1, "out of memory");
        return;
    }
    f.pts = m.videoPresentationTime;
    f.dts = m.videoDecodeTime;
    f.duration = m.videoDuration;
    f.timescale = m.videoTimescale;
    f.key = (m.videoSampleFlags & 1) == 0;  // the media sample flags' "not sync"
    if (!_startKnown) {
        // A start the clip does not state as a label is learnt from the
        // first frame, which stands at the in point.
        _startFrames = int64_t(m.timecodeFrame) - _inIndex;
        _startKnown = true;
    }
    const int64_t day = TimecodeLabel::framesPerDay(_timecodeBase, _dropFrame);
    f.cardIndex = ((int64_t(m.timecodeFrame) - _startFrames) % day + day) % day;
    *out = f;
}

void ClipIngest::takeAudio(const VestaKilnPlugInMediaSpecifier_Deprecated& m, std::optional<AudioDelivery>* out) {
    if (!m.audioBufferList) return;
    AudioDelivery a;
    a.presentationTime = m.audioPresentationTime;
    a.timescale = m.audioTimescale;
    const unsigned n = std::min(m.audioBufferList->mNumberBuffers, kMaxChannels);
    const AudioBuffer* buffers = m.audioBufferList->mBuffers;
    for (unsigned i = 0; i < n; ++i) {
        // A channel that has ended keeps an empty place in the list.
        uint8_t* data = static_cast<uint8_t*>(buffers[i].mData);
        a.channels.push_back(data ? wrapDelivered(data, buffers[i].mDataByteSize,
                                                  {nullptr, m.audioBufferManager, buffers[i].mDataByteSize,
                                                   m.audioMediaDisposeRefCon2})
                                  : nullptr);
    }
    *out = std::move(a);
}

bool ClipIngest::learnVideoFormat(const VestaKilnPlugInMediaSpecifier_Deprecated& m) {
    const uint8_t* description = m.videoImageDescription;
    const size_t size = m.videoImageDescriptionSize;
    if (!description || size < sizeof(ImageDescription))
        return fail(_lastCardIndex + 1, "the video comes without an image description");
    ImageDescription header;
    std::memcpy(&header, description, sizeof header);
    if (m.videoTimescale <= 0 || m.videoDuration <= 0)
        return fail(_lastCardIndex + 1, "the video comes without frame timing");

    MovieWriter::Video v;
    v.width = header.width;
    v.height = header.height;
    // 'pasp': horizontal and vertical spacing, big-endian.
    ByteReader pasp(CMImageDescriptionFindExtensionAtom(description, size, FourCC("pasp"), true));
    const uint32_t hSpacing = pasp.u32(), vSpacing = pasp.u32();
    if (pasp.ok() && hSpacing > 0 && vSpacing > 0)
        av_reduce(&v.sampleAspect.num, &v.sampleAspect.den, hSpacing, vSpacing, INT32_MAX);
    // 'fiel': field count, then the order (1 and 9 top first, 6 and 14 bottom first).
    ByteReader fiel(CMImageDescriptionFindExtensionAtom(description, size, FourCC("fiel"), true));
    const uint8_t fields = fiel.u8(), detail = fiel.u8();
    if (fiel.ok()) {
        if (fields == 1) v.fieldOrder = AV_FIELD_PROGRESSIVE;
        else if (detail == 1 || detail == 9) v.fieldOrder = AV_FIELD_TT;
        else if (detail == 6 || detail == 14) v.fieldOrder = AV_FIELD_BB;
    }
    const FourCharCode type = header.cType;
    if (isDV(type)) {
        // The card's own code tells the DV family (and so the raster the
        // frames decode to), which the frame header alone leaves to guesswork.
        v.codec = AV_CODEC_ID_DVVIDEO;
        v.tag = fourCharTag(type);
    } else if (isH264(type)) {
        v.codec = AV_CODEC_ID_H264;
        v.tag = MKTAG('a', 'v', 'c', '1');
        std::span<const uint8_t> avcC = CMImageDescriptionFindExtensionAtom(description, size, FourCC("avcC"), true);
        if (auto lengthSize = H264Sample::recordLengthSize(avcC)) {
            // Samples keep the record's length size only when it is four.
            v.extradata.assign(avcC.begin(), avcC.end());
            v.extradata[4] |= 3;
            if (type == FourCC("avc1")) _lengthSize = *lengthSize;
        }
        _reordered = m.videoDecodeTime != -1;
    } else {
        return fail(_lastCardIndex + 1, "its video codec '" + fourCharText(type) + "' cannot be written to a movie");
    }
    v.timescale = m.videoTimescale;
    av_reduce(&v.frameDuration.num, &v.frameDuration.den, m.videoDuration, m.videoTimescale, INT32_MAX);
    // The track's timescale also counts the timecode's frames exactly.
    const int64_t timecodeScale = _cardFrameDuration.den;
    const int64_t track = std::lcm(int64_t(m.videoTimescale), timecodeScale);
    v.trackTimescale = track <= INT32_MAX ? int32_t(track) : m.videoTimescale;

    // Removing a cadence changes the frame rate, and the stamps then count
    // from the first delivered frame; otherwise they count from the clip's start.
    _cadenceRemoved = int64_t(m.videoTimescale) * _cardFrameDuration.num !=
                      int64_t(m.videoDuration) * _cardFrameDuration.den;
    _origin = _cadenceRemoved ? 0 : _inIndex * m.videoDuration;
    _video = v;
    return true;
}

bool ClipIngest::learnAudioFormat(const VestaKilnPlugInMediaSpecifier_Deprecated& m, unsigned channels) {
    if (channels == 0) return true;
    if (!m.audioStreamDescription || m.audioStreamDescriptionSize < sizeof(AudioStreamBasicDescription))
        return fail(_lastCardIndex + 1, "the audio comes without a stream description");
    AudioStreamBasicDescription d;
    std::memcpy(&d, m.audioStreamDescription, sizeof d);
    const bool bigEndian = (d.mFormatFlags & kAudioFormatFlagIsBigEndian) != 0;
    MovieWriter::Audio a;
    if (d.mFormatID == kAudioFormatLinearPCM && !(d.mFormatFlags & kAudioFormatFlagIsFloat) &&
        (d.mFormatFlags & kAudioFormatFlagIsSignedInteger)) {
        if (d.mBitsPerChannel == 16) a.codec = bigEndian ? AV_CODEC_ID_PCM_S16BE : AV_CODEC_ID_PCM_S16LE;
        if (d.mBitsPerChannel == 24) a.codec = bigEndian ? AV_CODEC_ID_PCM_S24BE : AV_CODEC_ID_PCM_S24LE;
    }
    const double rate = d.mSampleRate;
    if (a.codec == AV_CODEC_ID_NONE || !(rate >= 1000 && rate <= 768000))
        return fail(_lastCardIndex + 1, "its audio (" + fourCharText(d.mFormatID) + ", " +
                                            std::to_string(d.mBitsPerChannel) + " bits) cannot be written to a movie");
    a.sampleRate = int(std::lround(rate));
    a.bytesPerSample = int(d.mBitsPerChannel / 8);
    a.channels = channels;
    a.multichannel = _options.multichannelAudio;
    _audio = a;
    _audioDelivered.assign(channels, 0);
    _audioWanted = av_rescale_rnd((_outIndex - _inIndex) * _cardFrameDuration.num, a.sampleRate,
                                  _cardFrameDuration.den, AV_ROUND_NEAR_INF);
    return true;
}

bool ClipIngest::acceptAudio(AudioDelivery a) {
    auto release = [&] {
        for (AVBufferRef*& ref : a.channels) av_buffer_unref(&ref);
    };
    if (!_error.empty() || !_audio) {
        release();
        return _error.empty();
    }
    const size_t bps = size_t(_audio->bytesPerSample);
    if (_audioTrim < 0) {
        // Stamps place a block only to trim what lies before the in point;
        // the samples themselves run on from the movie's start.
        const int64_t in = _cadenceRemoved ? 0
                                           : av_rescale_rnd(_inIndex * _cardFrameDuration.num, _audio->sampleRate,
                                                            _cardFrameDuration.den, AV_ROUND_NEAR_INF);
        const int64_t at = a.timescale > 0 ? av_rescale(a.presentationTime, _audio->sampleRate, a.timescale) : 0;
        _audioTrim = std::max<int64_t>(0, in - at);
        _trimLeft.assign(_audio->channels, _audioTrim);
    }
    for (size_t c = 0; c < a.channels.size(); ++c) {
        AVBufferRef*& ref = a.channels[c];
        if (!ref || c >= _audio->channels) {
            av_buffer_unref(&ref);
            continue;
        }
        ref->size -= ref->size % bps;
        const int64_t drop = std::min<int64_t>(_trimLeft[c], int64_t(ref->size / bps));
        ref->data += size_t(drop) * bps;
        ref->size -= size_t(drop) * bps;
        _trimLeft[c] -= drop;
        _audioDelivered[c] += int64_t(ref->size / bps);
        if (ref->size == 0) av_buffer_unref(&ref);
    }
    if (!_movie) {
        _pendingAudio.push_back(std::move(a));
        return true;
    }
    bool ok = true;
    for (size_t c = 0; c < a.channels.size(); ++c)
        if (a.channels[c] && !_movie->addAudio(unsigned(c), std::exchange(a.channels[c], nullptr))) ok = false;
    release();
    return ok || fail(_lastCardIndex + 1, _movie->error());
}

bool ClipIngest::acceptVideo(Frame f) {
    if (!_error.empty() || !_video) {
        av_buffer_unref(&f.buffer);
        return false;
    }
    ++_framesSeen;
    _lastCardIndex = std::max(_lastCardIndex, f.cardIndex);
    if (!_reordered) {
        if (f.cardIndex >= _outIndex) _videoDone = true;
    } else if (_reorderDelay && f.duration > 0) {
        // Every frame shown before the out point has come once the decode
        // order is that far past it.
        const int64_t decodeIndex = f.cardIndex + (f.dts - f.pts) / f.duration;
        if (decodeIndex - (*_reorderDelay + f.duration - 1) / f.duration >= _outIndex) _videoDone = true;
    }
    if (f.cardIndex < _inIndex || f.cardIndex >= _outIndex) {
        av_buffer_unref(&f.buffer);
        return true;
    }
    if (_video->codec == AV_CODEC_ID_H264 && !prepareH264(f)) {
        av_buffer_unref(&f.buffer);
        return false;
    }
    _pendingFrames.push_back(f);
    return true;
}

bool ClipIngest::prepareH264(Frame& f) {
    std::span<uint8_t> sample(f.buffer->data, f.buffer->size);
    std::optional<std::vector<H264Sample::Unit>> units;
    bool lengthPrefixed = false;
    if (_lengthSize) {
        units = H264Sample::unitsWithLengths(sample, *_lengthSize);
        lengthPrefixed = units.has_value();
    }
    if (!units) units = H264Sample::unitsWithStartCodes(sample);
    if (!units) return fail(f.cardIndex, "the frame is not an H.264 access unit");
    if (_video->extradata.empty())
        if (auto record = H264Sample::configurationRecord(sample, *units)) _video->extradata = std::move(*record);
    if (lengthPrefixed && *_lengthSize == 4) return true;
    if (!lengthPrefixed && H264Sample::replaceStartCodesInPlace(sample, *units)) return true;
    // Three-byte start codes (or shorter lengths) make the sample grow.
    AVBufferRef* converted = av_buffer_alloc(H264Sample::lengthPrefixedSize(*units));
    if (!converted) return fail(f.cardIndex, "out of memory");
    H264Sample::writeLengthPrefixed(sample, *units, converted->data);
    av_buffer_unref(&f.buffer);
    f.buffer = converted;
    return true;
}

bool ClipIngest::openMovieWhenReady(bool atEnd) {
    if (_movie || !_error.empty()) return _error.empty();
    if (!_video) return true;
    if (_video->codec == AV_CODEC_ID_H264 && _video->extradata.empty()) {
        if (!atEnd && _pendingFrames.size() < kLookahead) return true;
        return fail(_pendingFrames.empty() ? _inIndex : _pendingFrames.front().cardIndex,
                    "no H.264 parameter sets in its first frames");
    }
    const bool audioKnown = _audio || _clipChannels == 0;
    if (!audioKnown && !atEnd && _pendingFrames.size() < kFramesBeforeAudio) return true;

    const bool fractional = _cardFrameDuration.num == 1001;
    MovieWriter::Timecode timecode;
    timecode.label = timecodeOf(_inIndex);
    timecode.rate = fractional ? AVRational{int(_timecodeBase) * 1000, 1001} : AVRational{int(_timecodeBase), 1};
    std::string error;
    _movie = MovieWriter::open(*_file, _video, _audio, timecode, &error);
    if (!_movie) return fail(_inIndex, error);
    if (_outGiven && _audio) _movie->setAudioLimit(_audioWanted);
    for (AudioDelivery& a : _pendingAudio)
        for (size_t c = 0; c < a.channels.size(); ++c)
            if (a.channels[c] && !_movie->addAudio(unsigned(c), std::exchange(a.channels[c], nullptr)))
                return fail(_inIndex, _movie->error());
    _pendingAudio.clear();
    return true;
}

bool ClipIngest::releaseFrames(bool atEnd) {
    if (!_movie || !_error.empty()) return _error.empty();
    if (_reordered && !_reorderDelay) {
        if (!atEnd && !_videoDone && _pendingFrames.size() < kLookahead) return true;
        // Decode stamps count decode order from zero like presentation stamps
        // do, so reordered frames would be shown before they are decoded: the
        // decode times move back by the deepest reordering seen.
        int64_t delay = 0;
        for (const Frame& f : _pendingFrames) delay = std::max(delay, f.dts - f.pts);
        _reorderDelay = delay;
    }
    while (!_pendingFrames.empty()) {
        Frame f = _pendingFrames.front();
        _pendingFrames.pop_front();
        if (f.timescale != _video->timescale && f.timescale > 0) {
            f.pts = av_rescale(f.pts, _video->timescale, f.timescale);
            f.dts = f.dts == -1 ? -1 : av_rescale(f.dts, _video->timescale, f.timescale);
            f.duration = av_rescale(f.duration, _video->timescale, f.timescale);
        }
        const int64_t pts = f.pts - _origin;
        const int64_t dts = _reordered ? f.dts - _origin - *_reorderDelay : pts;
        if (dts > pts) {
            av_buffer_unref(&f.buffer);
            return fail(f.cardIndex, "its frames are reordered further than its first frames showed");
        }
        if (!_movie->writeVideo(f.buffer, pts, dts, f.duration, f.key)) return fail(f.cardIndex, _movie->error());
    }
    return true;
}
