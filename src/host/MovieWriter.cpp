#include "MovieWriter.h"

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavcodec/packet.h>
#include <libavformat/avformat.h>
#include <libavutil/buffer.h>
#include <libavutil/channel_layout.h>
#include <libavutil/log.h>
#include <libavutil/mathematics.h>
#include <libavutil/mem.h>
}

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <mutex>
#include <utility>

namespace {

std::mutex logLock;
std::string lastLibraryError;

// libavformat's own messages would break the host's one-line reports: they
// are kept, the last error among them goes into the report of a failure.
void keepLibraryMessage(void*, int level, const char* format, va_list args) {
    if (level > AV_LOG_ERROR) return;
    char text[512];
    std::vsnprintf(text, sizeof text, format, args);
    std::string line = text;
    while (!line.empty() && (line.back() == '\n' || line.back() == ' ')) line.pop_back();
    std::lock_guard<std::mutex> lock(logLock);
    lastLibraryError = line;
}

std::string takeLibraryError() {
    std::lock_guard<std::mutex> lock(logLock);
    return std::exchange(lastLibraryError, std::string());
}

std::string avErrorText(int status) {
    char text[AV_ERROR_MAX_STRING_SIZE] = {0};
    av_strerror(status, text, sizeof text);
    std::string detail = takeLibraryError();
    return detail.empty() ? std::string(text) : std::string(text) + " (" + detail + ")";
}

}  // namespace

std::unique_ptr<MovieWriter> MovieWriter::open(OutputFile& file, const std::optional<Video>& video,
                                               const std::optional<Audio>& audio,
                                               const std::optional<Timecode>& timecode, std::string* error) {
    static std::once_flag quiet;
    std::call_once(quiet, [] { av_log_set_callback(keepLibraryMessage); });
    takeLibraryError();
    std::unique_ptr<MovieWriter> writer(new MovieWriter);
    writer->_file = &file;
    writer->_video = video;
    writer->_audio = audio;
    auto failed = [&](const std::string& what) {
        if (error) *error = what;
        return nullptr;
    };
    if (avformat_alloc_output_context2(&writer->_format, nullptr, "mov", nullptr) < 0 || !writer->_format)
        return failed("libavformat has no QuickTime muxer");
    writer->_packet = av_packet_alloc();
    if (!writer->_packet) return failed("out of memory");
    AVFormatContext* format = writer->_format;
    format->pb = file.io();
    format->flags |= AVFMT_FLAG_CUSTOM_IO;
    // The card's own sample description codes ('dvh6', 'dvpp', ...) are kept
    // instead of being chosen again from the raster.
    format->strict_std_compliance = FF_COMPLIANCE_UNOFFICIAL;

    if (video) {
        AVStream* st = avformat_new_stream(format, nullptr);
        if (!st) return failed("out of memory");
        AVCodecParameters* par = st->codecpar;
        par->codec_type = AVMEDIA_TYPE_VIDEO;
        par->codec_id = video->codec;
        par->codec_tag = video->tag;
        par->width = video->width;
        par->height = video->height;
        par->field_order = AVFieldOrder(video->fieldOrder);
        par->sample_aspect_ratio = video->sampleAspect;
        st->sample_aspect_ratio = video->sampleAspect;
        if (!video->extradata.empty()) {
            par->extradata = static_cast<uint8_t*>(av_mallocz(video->extradata.size() + AV_INPUT_BUFFER_PADDING_SIZE));
            if (!par->extradata) return failed("out of memory");
            std::memcpy(par->extradata, video->extradata.data(), video->extradata.size());
            par->extradata_size = int(video->extradata.size());
        }
        st->time_base = AVRational{1, video->trackTimescale > 0 ? video->trackTimescale : video->timescale};
        st->avg_frame_rate = av_inv_q(video->frameDuration);
        if (timecode) {
            // The muxer makes the timecode track from this entry and counts its
            // frames at the video stream's average rate: the timecode's own rate
            // there, which need not be the movie's once a cadence is removed.
            st->avg_frame_rate = timecode->rate;
            av_dict_set(&st->metadata, "timecode", timecode->label.c_str(), 0);
        }
        writer->_videoStream = st->index;
    }
    if (audio) {
        const unsigned tracks = audio->multichannel ? 1 : audio->channels;
        const int channelsPerTrack = audio->multichannel ? int(audio->channels) : 1;
        for (unsigned i = 0; i < tracks; ++i) {
            AVStream* st = avformat_new_stream(format, nullptr);
            if (!st) return failed("out of memory");
            AVCodecParameters* par = st->codecpar;
            par->codec_type = AVMEDIA_TYPE_AUDIO;
            par->codec_id = audio->codec;
            par->sample_rate = audio->sampleRate;
            if (channelsPerTrack == 1) {
                av_channel_layout_default(&par->ch_layout, 1);
            } else {
                // Camera channels are discrete: no speaker positions are claimed.
                par->ch_layout.order = AV_CHANNEL_ORDER_UNSPEC;
                par->ch_layout.nb_channels = channelsPerTrack;
            }
            par->bits_per_coded_sample = audio->bytesPerSample * 8;
            par->block_align = audio->bytesPerSample * channelsPerTrack;
            st->time_base = AVRational{1, audio->sampleRate};
            writer->_audioStreams.push_back(st->index);
        }
        writer->_channels.resize(audio->channels);
    }
    int status = avformat_write_header(format, nullptr);
    if (status < 0) {
        std::string why = file.failure().empty() ? avErrorText(status) : file.failure();
        return failed("cannot start the movie: " + why);
    }
    return writer;
}

MovieWriter::~MovieWriter() {
    for (Channel& c : _channels)
        for (Block& b : c.blocks) av_buffer_unref(&b.ref);
    av_packet_free(&_packet);
    avformat_free_context(_format);
}

bool MovieWriter::fail(const std::string& what, int status) {
    if (_error.empty()) _error = what + ": " + (_file->failure().empty() ? avErrorText(status) : _file->failure());
    return false;
}

bool MovieWriter::writePacket(AVPacket* packet) {
    const int stream = packet->stream_index;
    int status = av_write_frame(_format, packet);
    av_packet_unref(packet);
    if (status < 0) return fail(stream == _videoStream ? "cannot write a video frame" : "cannot write audio", status);
    if (!_file->failure().empty()) return fail("cannot write", AVERROR(EIO));
    return true;
}

bool MovieWriter::writeVideo(AVBufferRef* frame, int64_t pts, int64_t dts, int64_t duration, bool key) {
    if (!_error.empty() || _videoStream < 0) {
        av_buffer_unref(&frame);
        return false;
    }
    // Audio first, up to the end of this frame, so the two interleave finely.
    if (_audio) {
        int64_t end = av_rescale(std::max<int64_t>(dts + duration, 0), _audio->sampleRate, _video->timescale);
        if (!writeAudioUntil(end)) {
            av_buffer_unref(&frame);
            return false;
        }
    }
    AVStream* st = _format->streams[_videoStream];
    const AVRational from = {1, _video->timescale};
    AVPacket* p = _packet;
    p->buf = frame;
    p->data = frame->data;
    p->size = int(frame->size);
    p->stream_index = _videoStream;
    p->pts = av_rescale_q(pts, from, st->time_base);
    p->dts = av_rescale_q(dts, from, st->time_base);
    p->duration = av_rescale_q(duration, from, st->time_base);
    p->flags = key ? AV_PKT_FLAG_KEY : 0;
    if (!writePacket(p)) return false;
    ++_videoFrames;
    return true;
}

bool MovieWriter::addAudio(unsigned channel, AVBufferRef* block) {
    if (!_error.empty() || !_audio || channel >= _channels.size() || !block) {
        av_buffer_unref(&block);
        return _error.empty();
    }
    Channel& c = _channels[channel];
    const int64_t bps = _audio->bytesPerSample;
    // Nothing past the limit is kept.
    int64_t room = _audioLimit == INT64_MAX ? INT64_MAX : std::max<int64_t>(0, _audioLimit - _audioWritten - c.samples);
    int64_t samples = std::min<int64_t>(int64_t(block->size) / bps, room);
    if (samples <= 0) {
        av_buffer_unref(&block);
        return true;
    }
    block->size = size_t(samples * bps);
    c.blocks.push_back({block, 0});
    c.samples += samples;
    _heldAudioBytes += block->size;
    // Past the budget the oldest audio goes out ahead of the video.
    while (_heldAudioBytes > kHeldAudioBytes && availableAudio() > 0)
        if (!writeAudioPacket()) return false;
    return true;
}

int64_t MovieWriter::availableAudio() const {
    if (_channels.empty()) return 0;
    int64_t n = INT64_MAX;
    for (const Channel& c : _channels) n = std::min(n, c.samples);
    return n;
}

int64_t MovieWriter::nextAudioBoundary(int64_t position) const {
    // Packets end where video frames end: k frames hold
    // floor(k x rate x frame duration) samples.
    const AVRational d = _video && _video->frameDuration.num > 0 ? _video->frameDuration : AVRational{1, 25};
    const int64_t perFrameNum = int64_t(_audio->sampleRate) * d.num;
    int64_t k = position * d.den / perFrameNum + 1;
    int64_t boundary = k * perFrameNum / d.den;
    while (boundary <= position) boundary = ++k * perFrameNum / d.den;
    return boundary;
}

void MovieWriter::consumeAudio(Channel& c, int64_t samples) {
    size_t bytes = size_t(samples * _audio->bytesPerSample);
    c.samples -= samples;
    while (bytes > 0 && !c.blocks.empty()) {
        Block& b = c.blocks.front();
        size_t take = std::min(bytes, b.ref->size - b.consumed);
        b.consumed += take;
        bytes -= take;
        if (b.consumed == b.ref->size) {
            _heldAudioBytes -= b.ref->size;
            av_buffer_unref(&b.ref);
            c.blocks.pop_front();
        }
    }
}

bool MovieWriter::writeAudioPacket() {
    const int64_t available = availableAudio();
    int64_t end = std::min({nextAudioBoundary(_audioWritten), _audioWritten + available, _audioLimit});
    const int64_t n = end - _audioWritten;
    if (n <= 0) return true;
    const size_t bps = size_t(_audio->bytesPerSample);
    AVPacket* p = _packet;
    if (_audio->multichannel) {
        const size_t channels = _channels.size();
        AVBufferRef* out = av_buffer_alloc(size_t(n) * bps * channels);
        if (!out) return fail("cannot write audio", AVERROR(ENOMEM));
        for (size_t ch = 0; ch < channels; ++ch) {
            uint8_t* to = out->data + ch * bps;
            int64_t left = n;
            for (const Block& b : _channels[ch].blocks) {
                const uint8_t* from = b.ref->data + b.consumed;
                int64_t here = std::min<int64_t>(left, int64_t((b.ref->size - b.consumed) / bps));
                for (int64_t s = 0; s < here; ++s, from += bps, to += bps * channels) std::memcpy(to, from, bps);
                left -= here;
                if (left == 0) break;
            }
        }
        p->buf = out;
        p->data = out->data;
        p->size = int(out->size);
        p->stream_index = _audioStreams[0];
        p->pts = p->dts = _audioWritten;
        p->duration = n;
        p->flags = AV_PKT_FLAG_KEY;
        if (!writePacket(p)) return false;
    } else {
        for (size_t ch = 0; ch < _channels.size(); ++ch) {
            // One packet per block the range touches: views of the delivered memory.
            int64_t at = _audioWritten, left = n;
            for (const Block& b : _channels[ch].blocks) {
                int64_t here = std::min<int64_t>(left, int64_t((b.ref->size - b.consumed) / bps));
                if (here <= 0) continue;
                p->buf = av_buffer_ref(b.ref);
                if (!p->buf) return fail("cannot write audio", AVERROR(ENOMEM));
                p->data = b.ref->data + b.consumed;
                p->size = int(size_t(here) * bps);
                p->stream_index = _audioStreams[ch];
                p->pts = p->dts = at;
                p->duration = here;
                p->flags = AV_PKT_FLAG_KEY;
                if (!writePacket(p)) return false;
                at += here;
                left -= here;
                if (left == 0) break;
            }
        }
    }
    for (Channel& c : _channels) consumeAudio(c, n);
    _audioWritten += n;
    return true;
}

bool MovieWriter::writeAudioUntil(int64_t sample) {
    sample = std::min(sample, _audioLimit);
    while (_audioWritten < sample && availableAudio() > 0)
        if (!writeAudioPacket()) return false;
    return true;
}

bool MovieWriter::finish() {
    if (!_error.empty()) return false;
    if (_audio && !writeAudioUntil(INT64_MAX)) return false;
    int status = av_write_trailer(_format);
    if (status < 0) return fail("cannot finish the movie", status);
    if (!_file->failure().empty()) return fail("cannot finish the movie", AVERROR(EIO));
    return true;
}
