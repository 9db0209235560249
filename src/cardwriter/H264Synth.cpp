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

std::vector<uint8_t> pps() {
    BitWriter w;
    w.ue(0);   // pic_parameter_set_id
    w.ue(0);   // seq_parameter_set_id
    w.bit(0);  // entropy_coding_mode_flag: CAVLC
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
    w.ue(0);  // pic_parameter_set_id
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
    if (p.picture == Picture::I) {
        // Every block I_16x16 with DC prediction and no coefficients:
        // mb_type 3, chroma DC prediction, qp delta 0, an empty DC block.
        for (uint32_t i = 0; i < mbs; ++i) {
            w.ue(3);
            w.ue(0);
            w.se(0);
            w.bit(1);
        }
    } else {
        w.ue(mbs);  // every block skipped
    }
    w.trailing();
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
        appendNAL(out, 0x68, pps());
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
