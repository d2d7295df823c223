#include "codec/h264_sps.h"

#include <cstring>
#include <vector>

#include <cstdio>

namespace {

// (1 << n) - 1 for n = 0 .. 32.
constexpr uint32_t Mask(int n) { return n >= 32 ? 0xFFFFFFFFu : (1u << n) - 1u; }

// Loop bounds from the standard, so that garbage counts cannot spin on missing data.
constexpr uint32_t kMaxPocCycle = 255;

void SkipScalingList(bs_s* s, int size) {
    int64_t last = 8, next = 8;
    for (int j = 0; j < size; ++j) {
        if (next != 0) next = ((last + bs_read_se(s)) % 256 + 256) % 256;
        last = next == 0 ? last : next;
    }
}

void ReadVui(bs_s* s, h264_sps_t* sps) {
    sps->aspect_ratio_info_present_flag = bs_read1(s);
    if (sps->aspect_ratio_info_present_flag) {
        sps->aspect_ratio_idc = bs_read(s, 8);
        if (sps->aspect_ratio_idc == 255) {  // Extended_SAR
            sps->sar_width = bs_read(s, 16);
            sps->sar_height = bs_read(s, 16);
        }
    }
    sps->overscan_info_present_flag = bs_read1(s);
    if (sps->overscan_info_present_flag) sps->overscan_appropriate_flag = bs_read1(s);
    sps->video_signal_type_present_flag = bs_read1(s);
    if (sps->video_signal_type_present_flag) {
        sps->video_format = bs_read(s, 3);
        sps->video_full_range_flag = bs_read1(s);
        sps->colour_description_present_flag = bs_read1(s);
        if (sps->colour_description_present_flag) {
            sps->colour_primaries = bs_read(s, 8);
            sps->transfer_characteristics = bs_read(s, 8);
            sps->matrix_coefficients = bs_read(s, 8);
        }
    }
    sps->chroma_loc_info_present_flag = bs_read1(s);
    if (sps->chroma_loc_info_present_flag) {
        sps->chroma_sample_loc_type_top_field = bs_read_ue(s);
        sps->chroma_sample_loc_type_bottom_field = bs_read_ue(s);
    }
    sps->timing_info_present_flag = bs_read1(s);
    if (sps->timing_info_present_flag) {
        bs_read(s, 32);  // num_units_in_tick, not kept
        sps->time_scale = bs_read(s, 32);
        sps->fixed_frame_rate_flag = bs_read1(s);
    }
    sps->nal_hrd_parameters_present_flag = bs_read1(s);
    if (sps->nal_hrd_parameters_present_flag) h264_decode_hrd_parameters(s, &sps->nal_hrd);
    sps->vcl_hrd_parameters_present_flag = bs_read1(s);
    if (sps->vcl_hrd_parameters_present_flag) h264_decode_hrd_parameters(s, &sps->vcl_hrd);
    if (sps->nal_hrd_parameters_present_flag || sps->vcl_hrd_parameters_present_flag) {
        sps->low_delay_hrd_flag = bs_read1(s);
    }
    sps->pic_struct_present_flag = bs_read1(s);
    sps->bitstream_restriction_flag = bs_read1(s);
    if (sps->bitstream_restriction_flag) {
        sps->motion_vectors_over_pic_boundaries_flag = bs_read1(s);
        sps->max_bytes_per_pic_denom = bs_read_ue(s);
        sps->max_bits_per_mb_denom = bs_read_ue(s);
        sps->log2_max_mv_length_horizontal = bs_read_ue(s);
        sps->log2_max_mv_length_vertical = bs_read_ue(s);
        sps->num_reorder_frames = bs_read_ue(s);
        sps->max_dec_frame_buffering = bs_read_ue(s);
    }
}

}  // namespace

void bs_init(bs_s* s, const uint8_t* data, unsigned size) {
    s->p_start = data;
    s->p = data;
    s->p_end = data + size;
    s->i_left = 8;
}

uint32_t bs_read(bs_s* s, int count) {
    uint64_t result = 0;
    while (count > 0 && s->p < s->p_end) {
        int take = count < s->i_left ? count : s->i_left;
        uint32_t bits = (*s->p >> (s->i_left - take)) & Mask(take);
        result = (result << take) | bits;
        count -= take;
        s->i_left -= take;
        if (s->i_left == 0) {
            ++s->p;
            s->i_left = 8;
        }
    }
    // Missing bits read as 0.
    if (count > 0) result <<= count;
    return static_cast<uint32_t>(result);
}

uint32_t bs_read1(bs_s* s) { return bs_read(s, 1); }

uint32_t bs_read_ue(bs_s* s) {
    int zeros = 0;
    while (zeros < 32 && s->p < s->p_end && bs_read1(s) == 0) ++zeros;
    uint64_t value = (uint64_t{1} << zeros) - 1 + bs_read(s, zeros);
    return static_cast<uint32_t>(value);
}

int32_t bs_read_se(bs_s* s) {
    uint32_t k = bs_read_ue(s);
    // 9.1.1: k odd -> (k + 1) / 2, k even -> -(k / 2)
    return (k & 1) ? static_cast<int32_t>((k >> 1) + 1) : -static_cast<int32_t>(k >> 1);
}

void h264_decode_hrd_parameters(bs_s* s, h264_hrd_t* hrd) {
    hrd->cpb_cnt_minus1 = bs_read_ue(s);
    hrd->bit_rate_scale = bs_read(s, 4);
    hrd->cpb_size_scale = bs_read(s, 4);
    // The standard allows at most 32 CPBs; a larger count is garbage and stops here.
    uint32_t count = hrd->cpb_cnt_minus1 < kMaxCpbCount ? hrd->cpb_cnt_minus1 + 1 : kMaxCpbCount;
    for (uint32_t i = 0; i < count; ++i) {
        hrd->bit_rate_value_minus1[i] = bs_read_ue(s);
        hrd->cpb_size_value_minus1[i] = bs_read_ue(s);
        hrd->cbr_flag[i] = bs_read1(s);
    }
    hrd->initial_cpb_removal_delay_length_minus1 = bs_read(s, 5);
    hrd->cpb_removal_delay_length_minus1 = bs_read(s, 5);
    hrd->dpb_output_delay_length_minus1 = bs_read(s, 5);
    hrd->time_offset_length = bs_read(s, 5);
}

uint32_t h264_parse_sps(const uint8_t* data, unsigned size, uint32_t previous_time_scale,
                        h264_sps_t* sps) {
    memset(sps, 0, sizeof *sps);
    // Emulation prevention (7.4.1): 00 00 03 -> 00 00. The last three bytes are copied as is.
    std::vector<uint8_t> rbsp;
    if (data != nullptr && size >= 6) {
        rbsp.reserve(size);
        unsigned i = 0;
        while (i + 3 < size) {
            if (data[i] == 0 && data[i + 1] == 0 && data[i + 2] == 3) {
                rbsp.push_back(0);
                rbsp.push_back(0);
                i += 3;
            } else {
                rbsp.push_back(data[i++]);
            }
        }
        while (i < size) rbsp.push_back(data[i++]);
    }
    bs_s s;
    bs_init(&s, rbsp.data(), static_cast<unsigned>(rbsp.size()));

    sps->profile_idc = bs_read(&s, 8);
    sps->constraint_flags = bs_read(&s, 8);
    sps->level_idc = bs_read(&s, 8);
    sps->seq_parameter_set_id = bs_read_ue(&s);
    if (sps->seq_parameter_set_id >= 32) return previous_time_scale;
    // Every profile from 100 up carries the chroma and scaling fields here.
    if (sps->profile_idc >= 100) {
        sps->chroma_format_idc = bs_read_ue(&s);
        if (sps->chroma_format_idc == 3) sps->separate_colour_plane_flag = bs_read1(&s);
        sps->bit_depth_luma_minus8 = bs_read_ue(&s);
        sps->bit_depth_chroma_minus8 = bs_read_ue(&s);
        sps->qpprime_y_zero_transform_bypass_flag = bs_read1(&s);
        sps->seq_scaling_matrix_present_flag = bs_read1(&s);
        if (sps->seq_scaling_matrix_present_flag) {
            int lists = sps->chroma_format_idc != 3 ? 8 : 12;
            for (int i = 0; i < lists; ++i) {
                if (bs_read1(&s)) SkipScalingList(&s, i < 6 ? 16 : 64);
            }
        }
    }
    sps->log2_max_frame_num_minus4 = bs_read_ue(&s);
    sps->pic_order_cnt_type = bs_read_ue(&s);
    if (sps->pic_order_cnt_type == 0) {
        sps->log2_max_pic_order_cnt_lsb_minus4 = bs_read_ue(&s);
    } else if (sps->pic_order_cnt_type == 1) {
        sps->delta_pic_order_always_zero_flag = bs_read1(&s);
        sps->offset_for_non_ref_pic = bs_read_se(&s);
        sps->offset_for_top_to_bottom_field = bs_read_se(&s);
        sps->num_ref_frames_in_pic_order_cnt_cycle = bs_read_ue(&s);
        uint32_t cycle = sps->num_ref_frames_in_pic_order_cnt_cycle;
        for (uint32_t i = 0; i < cycle && i < kMaxPocCycle; ++i) bs_read_se(&s);
    }
    sps->max_num_ref_frames = bs_read_ue(&s);
    sps->gaps_in_frame_num_value_allowed_flag = bs_read1(&s);
    sps->pic_width_in_mbs_minus1 = bs_read_ue(&s);
    sps->pic_height_in_map_units_minus1 = bs_read_ue(&s);
    sps->frame_mbs_only_flag = bs_read1(&s);
    if (!sps->frame_mbs_only_flag) sps->mb_adaptive_frame_field_flag = bs_read1(&s);
    sps->direct_8x8_inference_flag = bs_read1(&s);
    sps->frame_cropping_flag = bs_read1(&s);
    if (sps->frame_cropping_flag) {
        sps->frame_crop_left_offset = bs_read_ue(&s);
        sps->frame_crop_right_offset = bs_read_ue(&s);
        sps->frame_crop_top_offset = bs_read_ue(&s);
        sps->frame_crop_bottom_offset = bs_read_ue(&s);
    }
    sps->vui_parameters_present_flag = bs_read1(&s);
    if (sps->vui_parameters_present_flag) ReadVui(&s, sps);
    return sps->timing_info_present_flag ? sps->time_scale : previous_time_scale;
}

bool h264_sps_complaint(const h264_sps_t& sps, char* text, size_t size) {
    int n = 0;
    if (sps.seq_parameter_set_id >= 32) {
        n = snprintf(text, size, "invalid SPS (sps_id=%d)",
                     static_cast<int>(sps.seq_parameter_set_id));
    } else if (sps.num_reorder_frames > 16) {
        // The trailing newline is the television's text, printed inside the framing one.
        n = snprintf(text, size, "illegal num_reorder_frames %d\n",
                     static_cast<int>(sps.num_reorder_frames));
    } else if (size > 0) {
        text[0] = '\0';
    }
    return n > 0;
}

bool h264_picture_size(const uint8_t* sps, size_t size, uint16_t* width, uint16_t* height) {
    if (sps == nullptr || size < 4) return false;
    h264_sps_t parsed{};
    h264_parse_sps(sps + 1, static_cast<unsigned>(size - 1), 0, &parsed);
    const uint32_t frame_height_factor = 2 - (parsed.frame_mbs_only_flag & 1);
    const uint64_t w = (uint64_t{parsed.pic_width_in_mbs_minus1} + 1) * 16;
    const uint64_t h =
        (uint64_t{parsed.pic_height_in_map_units_minus1} + 1) * 16 * frame_height_factor;
    const uint64_t crop_w =
        2 * (uint64_t{parsed.frame_crop_left_offset} + parsed.frame_crop_right_offset);
    const uint64_t crop_h =
        2 * frame_height_factor *
        (uint64_t{parsed.frame_crop_top_offset} + parsed.frame_crop_bottom_offset);
    if (w > 16384 || h > 16384 || crop_w >= w || crop_h >= h) return false;
    *width = static_cast<uint16_t>(w - crop_w);
    *height = static_cast<uint16_t>(h - crop_h);
    return true;
}
