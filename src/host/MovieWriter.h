// A QuickTime movie written with libavformat from delivered sample memory:
// video packets as they come, audio cut into packets of one video frame's
// length from blocks that may span many seconds, interleaved with the video
// by time, and a timecode track.
//
// Packets reference the delivered memory (AVBufferRef) instead of copying it;
// the memory goes back to its owner when the last packet made from it is
// written. Audio blocks are held until the video reaches them, but never more
// than kHeldAudioBytes: past that the oldest audio is written ahead of the
// video, so memory stays flat however long the clip is.
#pragma once

#include "OutputFile.h"

extern "C" {
#include <libavcodec/codec_id.h>
#include <libavcodec/defs.h>
#include <libavutil/rational.h>
}

#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <vector>

struct AVBufferRef;
struct AVFormatContext;
struct AVPacket;

class MovieWriter {
public:
    // Self-contained clips deliver audio a frame's worth at a time, which
    // interleaves finely within this; clip-XML clips deliver up to 2 MiB a
    // channel (some 20 seconds) on every request, which no flat budget could
    // hold until the video gets there.
    static constexpr size_t kHeldAudioBytes = 4 * 1024 * 1024;

    struct Video {
        AVCodecID codec = AV_CODEC_ID_NONE;
        uint32_t tag = 0;  // the sample description's four-character code
        int width = 0, height = 0;
        AVRational sampleAspect = {0, 1};
        int fieldOrder = 0;  // AVFieldOrder
        std::vector<uint8_t> extradata;
        int32_t timescale = 0;            // of the stamps given to writeVideo
        int32_t trackTimescale = 0;       // of the movie's video track, a multiple of it
        AVRational frameDuration = {0, 1};  // seconds
    };
    struct Audio {
        AVCodecID codec = AV_CODEC_ID_NONE;
        int sampleRate = 0;
        int bytesPerSample = 0;
        unsigned channels = 0;
        bool multichannel = false;  // one track of all channels, else one mono track each
    };
    struct Timecode {
        std::string label;  // of the movie's first frame
        AVRational rate;    // frames per second the label counts
    };

    // nullptr with the reason in error.
    static std::unique_ptr<MovieWriter> open(OutputFile& file, const std::optional<Video>& video,
                                             const std::optional<Audio>& audio,
                                             const std::optional<Timecode>& timecode, std::string* error);
    // Drops what is still queued (giving the memory back).
    ~MovieWriter();
    MovieWriter(const MovieWriter&) = delete;
    MovieWriter& operator=(const MovieWriter&) = delete;

    // Takes the reference. Stamps in the video timescale, in decode order;
    // dts may be negative (reordered frames), pts not below dts.
    bool writeVideo(AVBufferRef* frame, int64_t pts, int64_t dts, int64_t duration, bool key);
    // Takes the reference to a block of whole samples of one channel.
    bool addAudio(unsigned channel, AVBufferRef* block);
    // Samples per channel beyond which audio is dropped.
    void setAudioLimit(int64_t samples) { _audioLimit = samples; }
    // Writes the audio that is left and the movie's index.
    bool finish();

    int64_t videoFrames() const { return _videoFrames; }
    // Per channel; every channel is written in step.
    int64_t audioSamples() const { return _audioWritten; }
    const std::string& error() const { return _error; }

private:
    struct Block {
        AVBufferRef* ref;
        size_t consumed;  // bytes already written
    };
    struct Channel {
        std::deque<Block> blocks;
        int64_t samples = 0;  // not yet written
    };

    MovieWriter() = default;
    bool fail(const std::string& what, int status);
    bool writePacket(AVPacket* packet);
    int64_t availableAudio() const;
    int64_t nextAudioBoundary(int64_t position) const;
    bool writeAudioPacket();
    bool writeAudioUntil(int64_t sample);
    void consumeAudio(Channel& channel, int64_t samples);

    AVFormatContext* _format = nullptr;
    OutputFile* _file = nullptr;
    AVPacket* _packet = nullptr;
    std::optional<Video> _video;
    std::optional<Audio> _audio;
    int _videoStream = -1;
    std::vector<int> _audioStreams;
    std::vector<Channel> _channels;
    size_t _heldAudioBytes = 0;
    int64_t _audioWritten = 0;
    int64_t _audioLimit = INT64_MAX;
    int64_t _videoFrames = 0;
    std::string _error;
};
