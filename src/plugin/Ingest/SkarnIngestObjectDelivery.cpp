// Ingest object: one media request, the next video frame and the next block
// of every audio channel, into the older media record.
#include "CFData.h"
#include "CoreAudioTypes.h"
#include "SkarnIngestObject.h"
#include "SkarnLog.h"

#include <cstdlib>
#include <cstring>

namespace {

// The scratch record each audio reader writes into is the record's own
// layout with room to spare, as hosts allocate it.
constexpr size_t kScratchRecordSize = 256;
static_assert(kScratchRecordSize >= sizeof(VestaKilnPlugInMediaSpecifier_Deprecated));

size_t bufferListSize(size_t buffers) { return (buffers - 1) * sizeof(AudioBuffer) + sizeof(AudioBufferList); }
size_t channelLayoutSize(size_t channels) {
    return (channels - 1) * sizeof(AudioChannelDescription) + sizeof(AudioChannelLayout);
}

// Adopts the +1 keeper a media reader left in the record.
template <class Keeper>
Ref<Keeper> takeKeeper(void* pointer) {
    return Ref<Keeper>::adopt(static_cast<Keeper*>(pointer));
}

}  // namespace

bool SkarnIngestObject::anyAudioHasData() const {
    for (const auto& reader : _audioReaders)
        if (reader->hasData()) return true;
    return false;
}

void SkarnIngestObject::deliverVideo(VestaKilnPlugInMediaSpecifier_Deprecated* media, int32_t* status,
                                     bool* delivered) {
    if (!_videoReader || !_videoReader->hasData()) return;
    // The first call skips leading samples that deliver nothing (repeats of a
    // cadence being removed) until a frame comes.
    do {
        media->videoData = nullptr;
        media->videoMediaDisposeRefCon2 = nullptr;
        *status = _videoReader->getNextMedia(media);
        if (*status != 0) _firstFrame = false;
        if (media->videoMediaDisposeRefCon2) {
            _bufferManager->addVideoBuffer(takeKeeper<SkarnVideoBuffer>(media->videoMediaDisposeRefCon2));
            media->videoBufferManager = _bufferManager.get();
        }
        _videoEndOfData = media->endOfMedia != 0;
        *delivered = media->videoData != nullptr;
    } while (_firstFrame && !*delivered && _videoReader->hasData());
    _firstFrame = false;
}

void SkarnIngestObject::deliverAudio(VestaKilnPlugInMediaSpecifier_Deprecated* media, bool videoDelivered,
                                     int32_t* status, bool* delivered) {
    // Channels may end at different times: audio goes on while any has data,
    // and a channel that has ended keeps an empty buffer in the list.
    if (_audioReaders.empty() || !anyAudioHasData()) return;
    const size_t n = _audioReaders.size();

    auto* scratch = static_cast<VestaKilnPlugInMediaSpecifier_Deprecated*>(std::calloc(1, kScratchRecordSize));
    auto* list = static_cast<AudioBufferList*>(std::calloc(1, bufferListSize(n)));
    auto* layout = static_cast<AudioChannelLayout*>(std::calloc(1, channelLayoutSize(n)));
    if (!scratch || !list || !layout) {
        std::free(scratch);
        std::free(list);
        std::free(layout);
        return;
    }
    if (videoDelivered) {
        scratch->videoPresentationTime = media->videoPresentationTime;
        scratch->videoTimescale = media->videoTimescale;
        scratch->videoTimingValid = 1;
    }
    list->mNumberBuffers = uint32_t(n);
    layout->mChannelLayoutTag = kAudioChannelLayoutTag_UseChannelDescriptions;
    layout->mNumberChannelDescriptions = uint32_t(n);
    CFDataRef listData = CFDataCreateWithBytesNoCopy(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(list),
                                                     CFIndex(bufferListSize(n)), kCFAllocatorDefault);
    CFDataRef layoutData = CFDataCreateWithBytesNoCopy(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(layout),
                                                       CFIndex(channelLayoutSize(n)), kCFAllocatorDefault);
    if (!listData || !layoutData) {
        std::free(scratch);
        if (!listData) std::free(list);
        if (!layoutData) std::free(layout);
        return;
    }
    CFDataRef descriptionData;
    bool shared = false;

    if (*status == 0) {
        for (size_t i = 0; i < n; ++i) {
            SkarnMediaReader* reader = _audioReaders[i].get();
            if (!reader->hasData()) continue;
            // No channel may carry what another left in the scratch record.
            scratch->audioBufferList = nullptr;
            scratch->audioMediaDisposeRefCon2 = nullptr;
            scratch->audioStreamDescription = nullptr;
            scratch->audioChannelLayout = nullptr;
            scratch->endOfMedia = 0;
            int32_t readerStatus = reader->getNextMedia(scratch);
            if (readerStatus != 0) {
                *status = readerStatus;
                break;
            }
            if (!scratch->audioBufferList) continue;
            if (!shared && scratch->audioStreamDescription) {
                // The first channel's description stands for the whole list:
                // n channels, one buffer each.
                auto* asbd = static_cast<AudioStreamBasicDescription*>(std::malloc(sizeof(AudioStreamBasicDescription)));
                if (asbd) {
                    std::memcpy(asbd, scratch->audioStreamDescription, sizeof *asbd);
                    asbd->mChannelsPerFrame = uint32_t(n);
                    asbd->mFormatFlags |= kAudioFormatFlagIsNonInterleaved;
                    descriptionData = CFDataCreateWithBytesNoCopy(kCFAllocatorDefault,
                                                                  reinterpret_cast<const UInt8*>(asbd),
                                                                  CFIndex(sizeof *asbd), kCFAllocatorDefault);
                    if (!descriptionData) std::free(asbd);
                }
                media->audioStreamDescription =
                    descriptionData ? const_cast<AudioStreamBasicDescription*>(
                                          reinterpret_cast<const AudioStreamBasicDescription*>(descriptionData->bytePtr()))
                                    : nullptr;
                media->audioStreamDescriptionSize = sizeof(AudioStreamBasicDescription);
                media->audioSampleCount = scratch->audioSampleCount;
                media->audioDataOffset = scratch->audioDataOffset;
                media->audioPresentationTime = scratch->audioPresentationTime;
                media->audioDecodeTime = scratch->audioDecodeTime;
                media->audioDuration = scratch->audioDuration;
                media->audioTimescale = scratch->audioTimescale;
                media->audioBufferManager = _bufferManager.get();
                shared = true;
            }
            list->mBuffers[i] = scratch->audioBufferList->mBuffers[0];
            if (scratch->audioChannelLayout && scratch->audioChannelLayout->mNumberChannelDescriptions > 0)
                layout->mChannelDescriptions[i].mChannelLabel =
                    scratch->audioChannelLayout->mChannelDescriptions[0].mChannelLabel;
            Ref<SkarnAudioBuffer> keeper = takeKeeper<SkarnAudioBuffer>(scratch->audioMediaDisposeRefCon2);
            keeper->setMasterAudioBufferList(listData);
            keeper->setMasterAudioStreamBasicDescription(descriptionData);
            keeper->setMasterAudioChannelLayout(layoutData);
            _bufferManager->addAudioBuffer(keeper);
        }
    }
    std::free(scratch);
    _audioEndOfData = !anyAudioHasData();
    if (!shared) return;  // nothing came: the list and layout go with their data objects
    media->audioChannelLayout = layout;
    media->audioChannelLayoutSize = channelLayoutSize(n);
    media->audioBufferList = list;
    *delivered = true;
}

int32_t SkarnIngestObject::getNextMedia_Deprecated(VestaKilnPlugInMediaSpecifier_Deprecated* media, void*) {
    if (!media) return 0;
    media->state = 99;
    // A record handed back again must not re-report last call's frame or keepers.
    media->videoData = nullptr;
    media->videoMediaDisposeRefCon2 = nullptr;
    media->audioBufferList = nullptr;
    media->audioMediaDisposeRefCon2 = nullptr;
    media->endOfMedia = 0;

    int32_t status = 0;
    bool videoDelivered = false, audioDelivered = false;
    deliverVideo(media, &status, &videoDelivered);
    deliverAudio(media, videoDelivered, &status, &audioDelivered);

    bool videoHasData = _videoReader && _videoReader->hasData();
    if (!_videoEndOfData && videoHasData)
        media->endOfMedia = 0;
    else if (!_audioEndOfData)
        media->endOfMedia = !anyAudioHasData() && !videoDelivered && !audioDelivered ? 1 : 0;
    else
        media->endOfMedia = videoDelivered || audioDelivered ? 0 : 1;

    if (status != 0) SkarnLog(1, "Returning err = %d from -[SkarnIngestObject getNextMedia]", status);
    return status;
}
