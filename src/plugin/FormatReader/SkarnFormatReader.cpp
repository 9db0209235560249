// The format reader object: its track list and the host's questions about
// the whole clip. Building the tracks is in SkarnFormatReaderTracks.cpp.
#include "SkarnFormatReader.h"

#include "SkarnLog.h"

std::vector<Ref<SkarnTrackReader>> SkarnFormatReader::trackList() const {
    std::lock_guard<std::mutex> lock(_trackListLock);
    return _trackList;
}

void SkarnFormatReader::setTrackList(std::vector<Ref<SkarnTrackReader>> tracks) {
    std::lock_guard<std::mutex> lock(_trackListLock);
    _trackList = std::move(tracks);
}

SkarnFormatReader::~SkarnFormatReader() {
    SkarnLog(8, "%@ dealloc", Object::description());
    // Tracks shared with a copy outlive this reader: they must not point back at it.
    for (const auto& track : trackList())
        if (track->formatReader() == this) track->setFormatReader(nullptr);
    setTrackList({});
}

void SkarnFormatReader::retain() const {
    int32_t count = incrementRetainCount();
    SkarnLog(4, "%@ retain %d", Object::description(), count);
    (void)count;
}

void SkarnFormatReader::release() const {
    SkarnLog(4, "%@ release %d", Object::description(), retainCount() - 1);
    if (decrementRetainCount() == 0) delete this;
}

SkarnTrackReader* SkarnFormatReader::videoTrack() const {
    std::lock_guard<std::mutex> lock(_trackListLock);
    return _trackList.empty() ? nullptr : _trackList.front().get();
}

std::vector<Ref<VestaKilnTrackReaderProtocol>> SkarnFormatReader::trackReaders() {
    std::vector<Ref<VestaKilnTrackReaderProtocol>> readers;
    for (auto& track : trackList()) readers.emplace_back(track);
    return readers;
}

CMTime SkarnFormatReader::duration() {
    SkarnTrackReader* video = videoTrack();
    CMTime d = video ? video->trackDuration() : kCMTimeInvalid;
    SkarnLog(2, "%@: duration: %lld/%d", this, d.value, d.timescale);
    return d;
}

int64_t SkarnFormatReader::timescale() {
    SkarnTrackReader* video = videoTrack();
    return video ? int64_t(video->frameDuration().timescale) : 0;
}

int64_t SkarnFormatReader::locationOffset() {
    SkarnTrackReader* video = videoTrack();
    return video ? video->dataOffset() : 0;
}

int64_t SkarnFormatReader::locationSize() {
    SkarnTrackReader* video = videoTrack();
    return video ? video->dataLength() : 0;
}

Ref<SkarnFormatReader> SkarnFormatReader::copyWithZone() const {
    Ref<SkarnFormatReader> copy(new SkarnFormatReader);
    SkarnLog(8, "%@ init", copy->Object::description());
    copy->setTrackList(trackList());
    copy->_mxfDataObject = _mxfDataObject;
    return copy;
}
