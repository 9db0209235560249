// A plain model of SkarnFileReader over the file's bytes in memory, for the
// differential test and the fuzz harness. It keeps no buffer: it works in range
// positions only (the reader's position P, where the file descriptor stands S,
// and how many bytes before S are buffered W) and takes every delivered byte
// straight from the file at P. The reader's deliberate rules are modelled, not
// smoothed over: refills and direct reads start where the descriptor stands,
// a direct read that comes back short counts nothing, a seek to the buffer's
// very first byte re-seeks, and a seek the descriptor cannot take (before the
// file's start) leaves the descriptor where it was.
#pragma once

#include <algorithm>
#include <cstdint>
#include <vector>

class FileReaderModel {
public:
    static constexpr uint64_t kMaxBufferSize = 4194304;

    FileReaderModel(const std::vector<uint8_t>& file, int64_t start, int64_t length, int64_t pageSize)
        : _file(file), _start(start), _length(length), _page(pageSize) {}

    int64_t position() const { return _p; }
    uint64_t remaining() const { return uint64_t(_length - _p); }
    int64_t sourcePosition() const { return _s; }
    uint64_t bufferedBytes() const { return uint64_t(_w); }
    uint64_t bufferSize() const { return _bufferSize; }

    // Appends the delivered bytes to `out`; answers their count.
    uint64_t read(uint64_t count, std::vector<uint8_t>& out) {
        uint64_t total = 0;
        while (total < count) {
            const uint64_t want = count - total;
            if (_p < _s) {
                const int64_t n = int64_t(std::min<uint64_t>(want, uint64_t(_s - _p)));
                deliver(n, out);
                total += uint64_t(n);
                if (_p == _s) _w = 0;
                continue;
            }
            if (_s == _length) return total;
            const int64_t direct = int64_t(want) / _page * _page;
            if (_bufferSize < want && _w == 0 && _p == _s && direct > 0) {
                const int64_t got = sourceRead(direct);
                if (got < direct) {
                    _p = _s;  // moved past bytes it does not count
                    return total;
                }
                deliver(direct, out);
                total += uint64_t(direct);
                continue;
            }
            const int64_t refill = int64_t(std::min(std::max<uint64_t>(_bufferSize, uint64_t(_page)), kMaxBufferSize));
            const int64_t n = std::min(refill, _length - _s);
            if (n == 0) return total;
            _w = sourceRead(n);
            if (_w != n) return total;
        }
        return total;
    }

    int64_t seek(int64_t target) {
        if (_p == target) return target;
        if (_s - _w < target && target <= _s) {
            _p = target;
            if (_p == _s) _w = 0;
            return target;
        }
        const int64_t c = std::min(target, _length);
        const int64_t pageStart = c - ((c % _page) + _page) % _page;
        _w = 0;
        if (_start + pageStart >= 0) _s = pageStart;
        _p = _s + (c - pageStart);
        return _p;
    }

    int64_t skip(int64_t count) {
        const int64_t buffered = _p < _s ? _s - _p : 0;
        if (buffered > count && _p + count >= _s - _w) {
            _p += count;
            return count;
        }
        const int64_t from = _p;
        return seek(_p + count) - from;
    }

    void discard() { skip(_length - _p); }

    void setBufferSize(uint64_t size) {
        if (size == _bufferSize) return;
        _bufferSize = std::min(size, kMaxBufferSize);
        const int64_t here = _p;
        discard();
        seek(here);
    }

private:
    // What one read at the descriptor gives: cut at the range's end, then at
    // the file's end.
    int64_t sourceRead(int64_t n) {
        n = std::min(n, _length - _s);
        const int64_t inFile = std::max<int64_t>(0, int64_t(_file.size()) - (_start + _s));
        const int64_t got = std::min(n, inFile);
        _s += got;
        return got;
    }

    void deliver(int64_t n, std::vector<uint8_t>& out) {
        const auto from = _file.begin() + (_start + _p);
        out.insert(out.end(), from, from + n);
        _p += n;
    }

    const std::vector<uint8_t>& _file;
    const int64_t _start;
    const int64_t _length;
    const int64_t _page;
    int64_t _p = 0;  // reader position
    int64_t _s = 0;  // where the descriptor stands
    int64_t _w = 0;  // bytes buffered before _s
    uint64_t _bufferSize = 32768;
};
