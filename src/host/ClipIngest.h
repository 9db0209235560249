// One clip into one movie, read the way an editing application reads it: the
// clip's ingest object is initialised and started, asked for media until it
// reports the end, and every frame and audio block it hands out goes back
// through its buffer managers once written; then it is stopped, cleaned up
// and torn down.
#pragma once

#include "MovieWriter.h"
#include "VestaKilnMediaProtocols.h"

#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

struct AVBufferRef;

class ClipIngest {
public:
    struct Options {
        std::optional<std::string> inPoint, outPoint;  // timecode labels of the clip
        bool multichannelAudio = false;
    };
    struct Report {
        std::string clip, output;
        bool ok = false;
        std::string error;  // "frame N (TIMECODE): cause" when not ok
        int64_t frames = 0;
        unsigned audioChannels = 0;
        int64_t audioSamples = 0;  // per channel
        uint64_t bytes = 0;
        double seconds = 0;
        std::string startTimecode;
        std::string frameRate;  // "30000/1001"
        std::string cadence;    // "24 in 29.97" when one was removed, else "none"
    };
    // Frames of the clip done so far and in all, and bytes written.
    using ProgressHandler = std::function<void(int64_t done, int64_t total, uint64_t bytes)>;

    ClipIngest(VestaKilnClipDataSourceProtocol& clip, std::string name, Options options);
    ~ClipIngest();

    // Writes DESTINATION.partial and renames it when the movie is complete;
    // removes it otherwise.
    Report run(const std::string& destination, const ProgressHandler& progress);

    // Asks every running ingest to stop at its next media request (for SIGINT).
    static void requestStop();
    static bool stopRequested();

private:
    struct Frame {
        AVBufferRef* buffer = nullptr;
        int64_t pts = 0, dts = -1, duration = 0;
        int32_t timescale = 0;
        bool key = true;
        int64_t cardIndex = 0;  // frames from the clip's start, by its timecode
    };
    struct AudioDelivery {
        std::vector<AVBufferRef*> channels;  // null where a channel gave nothing
        int64_t presentationTime = 0;
        int32_t timescale = 0;
    };

    // Clip facts and the requested span, in the clip's frames.
    bool readClip(std::string* error);
    // One media request; false when the ingest must stop (error set) or is at its end.
    bool pull(bool* endOfMedia);
    void takeVideo(const VestaKilnPlugInMediaSpecifier_Deprecated& media, std::optional<Frame>* frame);
    void takeAudio(const VestaKilnPlugInMediaSpecifier_Deprecated& media, std::optional<AudioDelivery>* audio);
    bool learnVideoFormat(const VestaKilnPlugInMediaSpecifier_Deprecated& media);
    bool learnAudioFormat(const VestaKilnPlugInMediaSpecifier_Deprecated& media, unsigned channels);
    bool acceptVideo(Frame frame);
    bool acceptAudio(AudioDelivery audio);
    bool prepareH264(Frame& frame);
    bool openMovieWhenReady(bool atEnd);
    bool releaseFrames(bool atEnd);
    bool finishedEarly() const;
    bool checkComplete();
    bool fail(int64_t cardIndex, const std::string& cause);
    void dropPending();
    std::string timecodeOf(int64_t cardIndex) const;

    VestaKilnClipDataSourceProtocol& _clip;
    std::string _name;
    Options _options;
    Ref<VestaKilnIngestObject> _ingest;
    void* _refCon = nullptr;

    // The clip.
    unsigned _timecodeBase = 0;
    bool _dropFrame = false;
    AVRational _cardFrameDuration = {0, 1};
    int64_t _startFrames = 0;  // the clip's start timecode as a frame count
    bool _startKnown = false;
    int64_t _clipFrames = 0;
    unsigned _clipChannels = 0;
    double _transportRate = 0, _shootingRate = 0;
    int64_t _inIndex = 0, _outIndex = 0;
    bool _outGiven = false;

    // What the deliveries turned out to be.
    std::optional<MovieWriter::Video> _video;
    std::optional<MovieWriter::Audio> _audio;
    bool _cadenceRemoved = false;
    int64_t _origin = 0;           // the movie's start in the delivered video stamps
    std::optional<unsigned> _lengthSize;  // of length-prefixed H.264 samples
    bool _reordered = false;
    std::optional<int64_t> _reorderDelay;  // in the delivered video timescale
    int64_t _audioTrim = -1;       // lead samples to drop; -1 until the first block
    std::vector<int64_t> _trimLeft;  // per channel
    int64_t _audioWanted = INT64_MAX;
    std::vector<int64_t> _audioDelivered;  // per channel, after the trim
    int64_t _lastCardIndex = -1;
    int64_t _framesSeen = 0;
    bool _videoDone = false;

    std::deque<Frame> _pendingFrames;
    std::vector<AudioDelivery> _pendingAudio;
    std::unique_ptr<OutputFile> _file;
    std::unique_ptr<MovieWriter> _movie;
    std::string _error;
};
