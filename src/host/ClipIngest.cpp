// Clip ingest: reading the clip, driving the ingest object, the span asked
// for, and the checks that the movie holds the whole of it. Turning the
// delivered records into packets is in ClipIngestMedia.cpp.
#include "ClipIngest.h"

#include "TimecodeLabel.h"

extern "C" {
#include <libavutil/buffer.h>
#include <libavutil/mathematics.h>
}

#include <atomic>
#include <cmath>
#include <cstring>
#include <numeric>
#include <sys/stat.h>

namespace {

std::atomic<bool> interrupted{false};  // by SIGINT

std::string number(int64_t n) { return std::to_string(n); }

}  // namespace

void ClipIngest::requestStop() { interrupted = true; }
bool ClipIngest::stopRequested() { return interrupted; }

ClipIngest::ClipIngest(VestaKilnClipDataSourceProtocol& clip, std::string name, Options options)
    : _clip(clip), _name(std::move(name)), _options(std::move(options)) {}

ClipIngest::~ClipIngest() {
    _movie.reset();
    dropPending();
}

void ClipIngest::dropPending() {
    for (Frame& f : _pendingFrames) av_buffer_unref(&f.buffer);
    _pendingFrames.clear();
    for (AudioDelivery& a : _pendingAudio)
        for (AVBufferRef*& ref : a.channels) av_buffer_unref(&ref);
    _pendingAudio.clear();
}

std::string ClipIngest::timecodeOf(int64_t cardIndex) const {
    return TimecodeLabel::label(_startFrames + cardIndex, _timecodeBase, _dropFrame);
}

bool ClipIngest::fail(int64_t cardIndex, const std::string& cause) {
    if (_error.empty()) {
        cardIndex = std::max(cardIndex, _inIndex);
        _error = "frame " + number(cardIndex) + " (" + timecodeOf(cardIndex) + "): " + cause;
    }
    return false;
}

bool ClipIngest::readClip(std::string* error) {
    _transportRate = _clip.transportRate();
    _shootingRate = _clip.valueForKey("shootingRate").doubleValue();
    _dropFrame = _clip.isDropFrame();
    // The timecode counts whole frames a second: 30 for 29.97, 60 for 59.94.
    const double base = _clip.valueForKey("frameRate").doubleValue();
    if (!std::isfinite(base) || base < 1 || base > 255) {
        *error = "the clip has no frame rate";
        return false;
    }
    _timecodeBase = unsigned(std::lround(base));
    const bool fractional = std::fabs(_transportRate - std::round(_transportRate)) > 0.001;
    _cardFrameDuration = fractional ? AVRational{1001, int(_timecodeBase) * 1000} : AVRational{1, int(_timecodeBase)};
    _clipFrames = _clip.mediaDuration().integerValue();
    _clipChannels = _clip.numberOfAudioChannels();
    if (_clipFrames <= 0) {
        *error = "the clip has no frames";
        return false;
    }
    Value start = _clip.mediaStart();
    if (start.isString()) {
        if (auto frames = TimecodeLabel::frames(start.string(), _timecodeBase, _dropFrame)) {
            _startFrames = *frames;
            _startKnown = true;
        }
    }

    const int64_t day = TimecodeLabel::framesPerDay(_timecodeBase, _dropFrame);
    auto indexOf = [&](const std::string& option, const std::string& label, int64_t* index) {
        auto frames = TimecodeLabel::frames(label, _timecodeBase, _dropFrame);
        if (!frames) {
            *error = option + " " + label + ": not a timecode of this clip (HH:MM:SS" + (_dropFrame ? ";" : ":") +
                     "FF, " + number(_timecodeBase) + " frames a second" + (_dropFrame ? ", drop-frame)" : ")");
            return false;
        }
        *index = ((*frames - _startFrames) % day + day) % day;
        return true;
    };
    _inIndex = 0;
    _outIndex = _clipFrames;
    const std::string end = timecodeOf(_clipFrames);
    if (_options.inPoint) {
        if (!indexOf("--in", *_options.inPoint, &_inIndex)) return false;
        if (_inIndex >= _clipFrames) {
            *error = "--in " + *_options.inPoint + " is outside the clip (" + timecodeOf(0) + " to " + end + ")";
            return false;
        }
    }
    if (_options.outPoint) {
        if (!indexOf("--out", *_options.outPoint, &_outIndex)) return false;
        if (_outIndex > _clipFrames || _outIndex <= _inIndex) {
            *error = "--out " + *_options.outPoint + " must lie after the in point (" + timecodeOf(_inIndex) +
                     ") and not past the clip's end (" + end + ")";
            return false;
        }
        _outGiven = true;
    }
    return true;
}

ClipIngest::Report ClipIngest::run(const std::string& destination, const ProgressHandler& progress) {
    const auto began = std::chrono::steady_clock::now();
    Report report;
    report.clip = _name;
    report.output = destination;
    std::string error;
    bool ready = false;
    try {
        ready = readClip(&error) && (_file = OutputFile::create(destination, &error)) != nullptr;
    } catch (const std::exception& e) {
        error = std::string("the plug-in stopped: ") + e.what();
    }
    if (!ready) {
        report.error = error;
        return report;
    }

    bool started = false;
    try {
        _ingest = _clip.ingestObject();
        _refCon = _clip.ingestObjectRefCon();
        if (!_ingest) {
            fail(_inIndex, "the plug-in gives no ingest object for the clip");
        } else {
            if (_inIndex > 0)
                _ingest->setInPoint(CMTimeMake(_inIndex * _cardFrameDuration.num, _cardFrameDuration.den), _refCon);
            started = true;  // a half-made initialisation is cleaned up too
            _ingest->initialize(_refCon);
            _ingest->start(_refCon);
            bool end = false;
            while (!end && pull(&end))
                if (progress)
                    progress(std::min(_lastCardIndex + 1, _outIndex) - _inIndex, _outIndex - _inIndex,
                             _file->bytesWritten());
            if (_error.empty() && openMovieWhenReady(true) && releaseFrames(true) && checkComplete() &&
                !_movie->finish())
                fail(_lastCardIndex + 1, _movie->error());
        }
    } catch (const std::exception& e) {
        // A hard assertion of the plug-in, made to throw by this host.
        fail(_lastCardIndex + 1, std::string("the plug-in stopped: ") + e.what());
    }
    if (_movie) {
        report.frames = _movie->videoFrames();
        report.audioSamples = _movie->audioSamples();
    }
    // Every delivered buffer goes back before the ingest object is cleaned
    // up: cleanup frees what is not given back.
    _movie.reset();
    dropPending();
    if (started) {
        try {
            _ingest->stop(_refCon);
            _ingest->cleanup(_refCon);
            _ingest->teardown(_refCon);
        } catch (const std::exception& e) {
            fail(_lastCardIndex + 1, std::string("the plug-in stopped: ") + e.what());
        }
    }
    if (_error.empty() && !_file->commit(&error)) fail(_lastCardIndex + 1, error);
    if (!_error.empty()) _file->discard();

    report.ok = _error.empty();
    report.error = _error;
    report.audioChannels = _audio ? _audio->channels : 0;
    struct stat st;
    report.bytes = report.ok && ::stat(destination.c_str(), &st) == 0 ? uint64_t(st.st_size) : _file->bytesWritten();
    report.seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - began).count();
    report.startTimecode = timecodeOf(_inIndex);
    if (_video) {
        AVRational rate = av_inv_q(_video->frameDuration);
        report.frameRate = number(rate.num) + "/" + number(rate.den);
    }
    report.cadence = "none";
    if (_cadenceRemoved) {
        char text[64];
        std::snprintf(text, sizeof text, "%g in %g", _shootingRate, _transportRate);
        report.cadence = text;
    }
    return report;
}

bool ClipIngest::pull(bool* endOfMedia) {
    if (interrupted) return fail(_lastCardIndex + 1, "interrupted");
    // A zero-filled record on every call.
    VestaKilnPlugInMediaSpecifier_Deprecated media;
    std::memset(&media, 0, sizeof media);
    const int32_t status = _ingest->getNextMedia_Deprecated(&media, _refCon);
    *endOfMedia = media.endOfMedia != 0;

    // Giving back the last block of a delivery frees the record's shared audio
    // list, so everything is taken out of the record before anything is
    // given back; the formats are read while the buffers are still held.
    std::optional<Frame> frame;
    std::optional<AudioDelivery> audio;
    takeVideo(media, &frame);
    takeAudio(media, &audio);
    if (frame && !_video) learnVideoFormat(media);
    if (audio && !_audio && _error.empty()) learnAudioFormat(media, unsigned(audio->channels.size()));
    if (status != 0) fail(_lastCardIndex + 1, "the plug-in could not read it (error " + number(status) + ")");

    if (audio) acceptAudio(std::move(*audio));
    if (frame) acceptVideo(*frame);
    if (!_error.empty()) return false;
    if (!openMovieWhenReady(*endOfMedia) || !releaseFrames(*endOfMedia)) return false;
    if (finishedEarly()) *endOfMedia = true;
    return true;
}

bool ClipIngest::finishedEarly() const {
    // Past the out point nothing more is pulled.
    if (!_outGiven || !_videoDone) return false;
    if (_clipChannels == 0) return true;
    if (!_audio) return false;
    for (int64_t delivered : _audioDelivered)
        if (delivered < _audioWanted) return false;
    return true;
}

bool ClipIngest::checkComplete() {
    // The plug-in ends a track quietly where its essence cannot be read, so
    // a short clip shows only as frames and samples that never came.
    if (!_video || _framesSeen == 0)
        return fail(_inIndex, "no video came from the clip (its essence file is short or unreadable)");
    // A removed cadence may leave up to two repeated frames unread at the end.
    const int64_t tolerance = _cadenceRemoved ? 2 : 0;
    if (_lastCardIndex + 1 + tolerance < _outIndex)
        return fail(_lastCardIndex + 1, "the video ends early, after " + number(_lastCardIndex + 1 - _inIndex) +
                                            " of " + number(_outIndex - _inIndex) +
                                            " frames (its essence file is short or unreadable)");
    if (_clipChannels == 0) return true;
    if (!_audio) return fail(_inIndex, "no audio came from the clip's " + number(_clipChannels) + " channels");
    if (_audio->channels < _clipChannels)
        return fail(_inIndex, "only " + number(_audio->channels) + " of the clip's " + number(_clipChannels) +
                                  " audio channels came");
    const double perFrame = double(_audio->sampleRate) * av_q2d(_cardFrameDuration);
    for (size_t c = 0; c < _audioDelivered.size(); ++c) {
        if (double(_audioDelivered[c]) + std::ceil(perFrame) + 1 >= double(_audioWanted)) continue;
        return fail(_inIndex + int64_t(double(_audioDelivered[c]) / perFrame),
                    "audio channel " + number(int64_t(c) + 1) + " ends early, after " + number(_audioDelivered[c]) +
                        " of " + number(_audioWanted) + " samples (its essence file is short or unreadable)");
    }
    return true;
}
