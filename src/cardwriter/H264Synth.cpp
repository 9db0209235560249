#include "H264Synth.h"

#include <cstring>

namespace {

class BitWriter {
public:
    void bit(uint32_t b) {
        _cur = uint8_t(_cur << 1 | (b & 1));
        if (++_n == 8) {
            _out.push_back(_cur);
            _cur = 0;
            _n = 0;
        }
    }
    void bits(uint32_t v, int count) {
        for (int i = count - 1; i >= 0; --i) bit(v >> i);
    }
    // Exp-Golomb codes.
    void ue(uint32_t v) {
        uint64_t x = uint64_t(v) + 1;
        int len = 0;
        while ((x >> len) > 1) ++len;
        for (int i = 0; i < len; ++i) bit(0);
        for (int i = len; i >= 0; --i) bit(uint32_t(x >> i));
    }
    void se(int32_t v) { ue(v <= 0 ? uint32_t(-2 * int64_t(v)) : uint32_t(2 * int64_t(v) - 1)); }
    void trailing() {
        bit(1);
        while (_n != 0) bit(0);
    }
    bool aligned() const { return _n == 0; }
    std::vector<uint8_t> take() { return std::move(_out); }

private:
    std::vector<uint8_t> _out;
    uint8_t _cur = 0;
    int _n = 0;
};

// Appends a NAL unit behind a four-byte start code, inserting emulation
// prevention bytes so no 00 00 0x (x <= 3) appears inside.
void appendNAL(std::vector<uint8_t>& out, uint8_t header, const std::vector<uint8_t>& rbsp) {
    out.insert(out.end(), {0, 0, 0, 1, header});
    int zeros = 0;
    for (uint8_t b : rbsp) {
        if (zeros >= 2 && b <= 3) {
            out.push_back(3);
            zeros = 0;
        }
        out.push_back(b);
        zeros = b == 0 ? zeros + 1 : 0;
    }
}

// The arithmetic coder of H.264 (CABAC), encoding side, for the few syntax
// elements a grey intra picture needs. Tables and procedures are those of the
// H.264 standard, clause 9.3.
class CabacWriter {
public:
    // Contexts start from (m, n) pairs at the slice's QP.
    struct Init {
        int m, n;
    };
    CabacWriter(BitWriter& w, int sliceQP, std::initializer_list<std::pair<int, Init>> contexts) : _w(w) {
        const int qp = sliceQP < 0 ? 0 : sliceQP > 51 ? 51 : sliceQP;
        for (const auto& [index, init] : contexts) {
            int pre = ((init.m * qp) >> 4) + init.n;
            pre = pre < 1 ? 1 : pre > 126 ? 126 : pre;
            _state[index] = pre <= 63 ? uint8_t(63 - pre) : uint8_t(pre - 64);
            _mps[index] = pre <= 63 ? 0 : 1;
        }
    }
    void decision(int ctx, int bin) {
        static constexpr uint8_t kRangeLPS[64][4] = {
            {128, 176, 208, 240}, {128, 167, 197, 227}, {128, 158, 187, 216}, {123, 150, 178, 205},
            {116, 142, 169, 195}, {111, 135, 160, 185}, {105, 128, 152, 175}, {100, 122, 144, 166},
            {95, 116, 137, 158},  {90, 110, 130, 150},  {85, 104, 123, 142},  {81, 99, 117, 135},
            {77, 94, 111, 128},   {73, 89, 105, 122},   {69, 85, 100, 116},   {66, 80, 95, 110},
            {62, 76, 90, 104},    {59, 72, 86, 99},     {56, 69, 81, 94},     {53, 65, 77, 89},
            {51, 62, 73, 85},     {48, 59, 69, 80},     {46, 56, 66, 76},     {43, 53, 63, 72},
            {41, 50, 59, 69},     {39, 48, 56, 65},     {37, 45, 54, 62},     {35, 43, 51, 59},
            {33, 41, 48, 56},     {32, 39, 46, 53},     {30, 37, 43, 50},     {29, 35, 41, 48},
            {27, 33, 39, 45},     {26, 31, 37, 43},     {24, 30, 35, 41},     {23, 28, 33, 39},
            {22, 27, 32, 37},     {21, 26, 30, 35},     {20, 24, 29, 33},     {19, 23, 27, 31},
            {18, 22, 26, 30},     {17, 21, 25, 28},     {16, 20, 23, 27},     {15, 19, 22, 25},
            {14, 18, 21, 24},     {14, 17, 20, 23},     {13, 16, 19, 22},     {12, 15, 18, 21},
            {12, 14, 17, 20},     {11, 14, 16, 19},     {11, 13, 15, 18},     {10, 12, 15, 17},
            {10, 12, 14, 16},     {9, 11, 13, 15},      {9, 11, 12, 14},      {8, 10, 12, 14},
            {8, 9, 11, 13},       {7, 9, 11, 12},       {7, 9, 10, 12},       {7, 8, 10, 11},
            {6, 8, 9, 11},        {6, 7, 9, 10},        {6, 7, 8, 9},         {2, 2, 2, 2}};
        static constexpr uint8_t kTransLPS[64] = {
            0,  0,  1,  2,  2,  4,  4,  5,  6,  7,  8,  9,  9,  11, 11, 12, 13, 13, 15, 15, 16, 16,
            18, 18, 19, 19, 21, 21, 22, 22, 23, 24, 24, 25, 26, 26, 27, 27, 28, 29, 29, 30, 30, 30,
            31, 32, 32, 33, 33, 33, 34, 34, 35, 35, 35, 36, 36, 36, 37, 37, 37, 38, 38, 63};
        uint8_t& state = _state[ctx];
        uint8_t& mps = _mps[ctx];
        const uint32_t lps = kRangeLPS[state][(_range >> 6) & 3];
        _range -= lps;
        if (bin != mps) {
            _low += _range;
            _range = lps;
            if (state == 0) mps = uint8_t(1 - mps);
            state = kTransLPS[state];
        } else if (state < 62) {
            ++state;
        }
        renormalise();
    }
    // end_of_slice_flag and the I_PCM bin of mb_type; 1 ends the slice data,
    // its last bit doubling as the RBSP stop bit.
    void terminate(int bin) {
        _range -= 2;
        if (!bin) {
            renormalise();
            return;
        }
        _low += _range;
        _range = 2;
        renormalise();
        put((_low >> 9) & 1);
        _w.bits(((_low >> 7) & 3) | 1, 2);
        while (!_w.aligned()) _w.bit(0);
    }

private:
    void renormalise() {
        while (_range < 256) {
            if (_low < 256) {
                put(0);
            } else if (_low >= 512) {
                _low -= 512;
                put(1);
            } else {
                _low -= 256;
                ++_outstanding;
            }
            _range <<= 1;
            _low <<= 1;
        }
    }
    void put(uint32_t b) {
        if (_first)
            _first = false;
        else
            _w.bit(b);
        for (; _outstanding > 0; --_outstanding) _w.bit(1 - b);
    }

    BitWriter& _w;
    uint32_t _low = 0, _range = 510, _outstanding = 0;
    bool _first = true;
    uint8_t _state[1024] = {};
    uint8_t _mps[1024] = {};
};

uint32_t mbWidth(const H264SynthParams& p) { return (p.width + 15) / 16; }
uint32_t mbHeight(const H264SynthParams& p) { return (p.height + 15) / 16; }

std::vector<uint8_t> sps(const H264SynthParams& p) {
    BitWriter w;
    w.bits(122, 8);  // High 4:2:2 profile
    w.bits(0, 8);    // constraint flags
    w.bits(41, 8);   // level 4.1
    w.ue(0);         // seq_parameter_set_id
    w.ue(2);         // chroma_format_idc 4:2:2
    w.ue(2);         // bit_depth_luma_minus8
    w.ue(2);         // bit_depth_chroma_minus8
    w.bit(0);        // qpprime_y_zero_transform_bypass_flag
    w.bit(0);        // seq_scaling_matrix_present_flag
    w.ue(4);         // log2_max_frame_num_minus4 -> 8 bits
    w.ue(0);         // pic_order_cnt_type 0
    w.ue(4);         // log2_max_pic_order_cnt_lsb_minus4 -> 8 bits
    w.ue(2);         // max_num_ref_frames
    w.bit(0);        // gaps_in_frame_num_value_allowed_flag
    w.ue(mbWidth(p) - 1);
    w.ue(mbHeight(p) - 1);
    w.bit(1);        // frame_mbs_only_flag
    w.bit(1);        // direct_8x8_inference_flag
    uint32_t cropBottom = mbHeight(p) * 16 - p.height;
    uint32_t cropRight = mbWidth(p) * 16 - p.width;
    bool crop = cropBottom || cropRight;
    w.bit(crop);
    if (crop) {
        // 4:2:2: crop units are 2 luma samples across, 1 down.
        w.ue(0);
        w.ue(cropRight / 2);
        w.ue(0);
        w.ue(cropBottom);
    }
    w.bit(0);        // vui_parameters_present_flag
    w.trailing();
    return w.take();
}

// Two picture parameter sets: 0 with CAVLC for the skipped P and B pictures
// (a run length says it all), 1 with CABAC for intra pictures, whose blocks
// cannot be skipped: coded with CAVLC they take a byte each, more than many
// card frames hold; the arithmetic coder brings a grey picture to a fraction of
// a bit per block.
constexpr uint32_t kCAVLCPPS = 0;
constexpr uint32_t kCABACPPS = 1;

std::vector<uint8_t> pps(uint32_t id) {
    BitWriter w;
    w.ue(id);  // pic_parameter_set_id
    w.ue(0);   // seq_parameter_set_id
    w.bit(id == kCABACPPS);  // entropy_coding_mode_flag
    w.bit(0);  // bottom_field_pic_order_in_frame_present_flag
    w.ue(0);   // num_slice_groups_minus1
    w.ue(0);   // num_ref_idx_l0_default_active_minus1
    w.ue(0);   // num_ref_idx_l1_default_active_minus1
    w.bit(0);  // weighted_pred_flag
    w.bits(0, 2);
    w.se(0);   // pic_init_qp_minus26
    w.se(0);   // pic_init_qs_minus26
    w.se(0);   // chroma_qp_index_offset
    w.bit(1);  // deblocking_filter_control_present_flag
    w.bit(0);  // constrained_intra_pred_flag
    w.bit(0);  // redundant_pic_cnt_present_flag
    w.trailing();
    return w.take();
}

std::vector<uint8_t> slice(const H264SynthParams& p) {
    using Picture = H264SynthParams::Picture;
    BitWriter w;
    const uint32_t mbs = mbWidth(p) * mbHeight(p);
    w.ue(0);  // first_mb_in_slice
    w.ue(p.picture == Picture::I ? 7 : p.picture == Picture::P ? 5 : 6);
    w.ue(p.picture == Picture::I ? kCABACPPS : kCAVLCPPS);
    w.bits(p.frameNum & 0xff, 8);
    bool idr = p.picture == Picture::I && p.idr;
    if (idr) w.ue(p.idrPicID);
    w.bits(p.pocLsb & 0xff, 8);
    if (p.picture == Picture::B) w.bit(1);  // direct_spatial_mv_pred_flag
    if (p.picture != Picture::I) {
        w.bit(0);  // num_ref_idx_active_override_flag
        w.bit(0);  // ref_pic_list_modification_flag_l0
        if (p.picture == Picture::B) w.bit(0);  // ..._l1
    }
    if (p.picture != Picture::B) {  // reference pictures carry dec_ref_pic_marking
        if (idr) {
            w.bit(0);  // no_output_of_prior_pics_flag
            w.bit(0);  // long_term_reference_flag
        } else {
            w.bit(0);  // adaptive_ref_pic_marking_mode_flag
        }
    }
    w.se(0);  // slice_qp_delta
    w.ue(1);  // disable_deblocking_filter_idc
    if (p.picture != Picture::I) {
        w.ue(mbs);  // every block skipped
        w.trailing();
        return w.take();
    }
    while (!w.aligned()) w.bit(1);  // cabac_alignment_one_bit
    // Every block I_16x16 with DC prediction and no coefficients (mb_type 3,
    // bins 1 0 0 0 1 0), chroma DC prediction, qp delta 0, an empty luma DC
    // block. Context (m, n) values for I slices: mb_type 3-10, mb_qp_delta 60,
    // intra_chroma_pred_mode 64, coded_block_flag of luma DC 85-88.
    CabacWriter c(w, 26, {{3, {20, -15}},  {4, {2, 54}},   {5, {3, 74}},   {6, {-28, 127}},
                          {7, {-23, 104}}, {8, {-6, 53}},  {9, {-1, 54}},  {10, {7, 51}},
                          {60, {0, 41}},   {64, {-9, 83}}, {85, {-17, 123}}, {86, {-12, 115}},
                          {87, {-16, 122}}, {88, {-11, 115}}});
    const uint32_t across = mbWidth(p);
    for (uint32_t i = 0; i < mbs; ++i) {
        const bool left = i % across != 0, above = i >= across;
        // mb_type: neighbours that are not I_NxN raise the first bin's context.
        c.decision(3 + int(left) + int(above), 1);
        c.terminate(0);        // not I_PCM
        c.decision(6, 0);      // no luma AC coefficients
        c.decision(7, 0);      // no chroma coefficients
        c.decision(9, 1);      // prediction mode 2 (DC): bins 1 0
        c.decision(10, 0);
        c.decision(64, 0);     // intra_chroma_pred_mode 0 (DC); neighbours all 0
        c.decision(60, 0);     // mb_qp_delta 0; the previous block's was 0 too
        // coded_block_flag 0: a missing neighbour of an intra block counts as
        // coded, a present one's empty DC block as not.
        c.decision(85 + int(!left) + 2 * int(!above), 0);
        c.terminate(i + 1 == mbs);  // end_of_slice_flag
    }
    return w.take();
}

}  // namespace

std::vector<uint8_t> makeH264AccessUnit(const H264SynthParams& p, size_t size) {
    using Picture = H264SynthParams::Picture;
    std::vector<uint8_t> out;
    out.reserve(size);
    appendNAL(out, 0x09, {uint8_t(p.picture == Picture::I ? 0x10 : p.picture == Picture::P ? 0x30 : 0x50)});
    if (p.parameterSets) {
        appendNAL(out, 0x67, sps(p));
        appendNAL(out, 0x68, pps(kCAVLCPPS));
        appendNAL(out, 0x68, pps(kCABACPPS));
    }
    uint8_t header = p.picture == Picture::I ? (p.idr ? 0x65 : 0x61) : p.picture == Picture::P ? 0x41 : 0x01;
    appendNAL(out, header, slice(p));
    // Filler data NAL unit (type 12): 0xFF bytes, then the trailing 0x80.
    if (out.size() + 6 <= size) {
        out.insert(out.end(), {0, 0, 0, 1, 0x0c});
        out.resize(size - 1, 0xff);
        out.push_back(0x80);
    }
    return out;
}
