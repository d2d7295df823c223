#pragma once

#include <cstddef>
#include <cstdint>

// H.264 sequence parameter set parsing (ITU-T H.264 7.3.2.1.1 with the VUI of E.1.1 and the
// HRD parameters of E.1.2). Only time_scale is used by the service; the rest is decoded so
// that the bit position after each field stays the standard's.

// Bit reader over a byte range. Reading past the end yields 0 bits and does not move.
struct bs_s {
    const uint8_t* p_start;
    const uint8_t* p;
    const uint8_t* p_end;
    int i_left;  // bits still unread in *p, 8 down to 1
};

void bs_init(bs_s* s, const uint8_t* data, unsigned size);
uint32_t bs_read(bs_s* s, int count);  // count 0..32
uint32_t bs_read1(bs_s* s);
// Exp-Golomb (9.1): at most 32 leading zero bits are counted.
uint32_t bs_read_ue(bs_s* s);
int32_t bs_read_se(bs_s* s);

constexpr int kMaxCpbCount = 32;

struct h264_hrd_t {
    uint32_t cpb_cnt_minus1;
    uint32_t bit_rate_scale;
    uint32_t cpb_size_scale;
    uint32_t bit_rate_value_minus1[kMaxCpbCount];
    uint32_t cpb_size_value_minus1[kMaxCpbCount];
    uint32_t cbr_flag[kMaxCpbCount];
    uint32_t initial_cpb_removal_delay_length_minus1;
    uint32_t cpb_removal_delay_length_minus1;
    uint32_t dpb_output_delay_length_minus1;
    uint32_t time_offset_length;
};

struct h264_sps_t {
    uint32_t profile_idc;
    uint32_t constraint_flags;
    uint32_t level_idc;
    uint32_t seq_parameter_set_id;
    uint32_t chroma_format_idc;
    uint32_t separate_colour_plane_flag;
    uint32_t bit_depth_luma_minus8;
    uint32_t bit_depth_chroma_minus8;
    uint32_t qpprime_y_zero_transform_bypass_flag;
    uint32_t seq_scaling_matrix_present_flag;
    uint32_t log2_max_frame_num_minus4;
    uint32_t pic_order_cnt_type;
    uint32_t log2_max_pic_order_cnt_lsb_minus4;
    uint32_t delta_pic_order_always_zero_flag;
    int32_t offset_for_non_ref_pic;
    int32_t offset_for_top_to_bottom_field;
    uint32_t num_ref_frames_in_pic_order_cnt_cycle;
    uint32_t max_num_ref_frames;
    uint32_t gaps_in_frame_num_value_allowed_flag;
    uint32_t pic_width_in_mbs_minus1;
    uint32_t pic_height_in_map_units_minus1;
    uint32_t frame_mbs_only_flag;
    uint32_t mb_adaptive_frame_field_flag;
    uint32_t direct_8x8_inference_flag;
    uint32_t frame_cropping_flag;
    uint32_t frame_crop_left_offset;
    uint32_t frame_crop_right_offset;
    uint32_t frame_crop_top_offset;
    uint32_t frame_crop_bottom_offset;
    uint32_t vui_parameters_present_flag;
    // VUI
    uint32_t aspect_ratio_info_present_flag;
    uint32_t aspect_ratio_idc;
    uint32_t sar_width;
    uint32_t sar_height;
    uint32_t overscan_info_present_flag;
    uint32_t overscan_appropriate_flag;
    uint32_t video_signal_type_present_flag;
    uint32_t video_format;
    uint32_t video_full_range_flag;
    uint32_t colour_description_present_flag;
    uint32_t colour_primaries;
    uint32_t transfer_characteristics;
    uint32_t matrix_coefficients;
    uint32_t chroma_loc_info_present_flag;
    uint32_t chroma_sample_loc_type_top_field;
    uint32_t chroma_sample_loc_type_bottom_field;
    uint32_t timing_info_present_flag;
    uint32_t time_scale;
    uint32_t fixed_frame_rate_flag;
    uint32_t nal_hrd_parameters_present_flag;
    uint32_t vcl_hrd_parameters_present_flag;
    h264_hrd_t nal_hrd;
    h264_hrd_t vcl_hrd;
    uint32_t low_delay_hrd_flag;
    uint32_t pic_struct_present_flag;
    uint32_t bitstream_restriction_flag;
    uint32_t motion_vectors_over_pic_boundaries_flag;
    uint32_t max_bytes_per_pic_denom;
    uint32_t max_bits_per_mb_denom;
    uint32_t log2_max_mv_length_horizontal;
    uint32_t log2_max_mv_length_vertical;
    uint32_t num_reorder_frames;
    uint32_t max_dec_frame_buffering;
};

void h264_decode_hrd_parameters(bs_s* s, h264_hrd_t* hrd);

// Parses an SPS given without its NAL header byte (emulation prevention still in place).
// Returns the time_scale to keep: the SPS's own when it carries timing information, else
// `previous_time_scale`. Complaints (sps_id over 31, more than 16 reorder frames) do not stop
// it; h264_sps_complaint words them for the caller's trace, which keeps this layer pure.
uint32_t h264_parse_sps(const uint8_t* data, unsigned size, uint32_t previous_time_scale,
                        h264_sps_t* sps);

// The complaint about an SPS h264_parse_sps filled, written into `text` (cut to `size`).
// False, with `text` empty, when there is none.
bool h264_sps_complaint(const h264_sps_t& sps, char* text, size_t size);

// The picture's displayed size from an SPS given with its NAL header byte (4:2:0 cropping).
// False when the SPS is too short or gives a size over 16384 or cropped to nothing.
bool h264_picture_size(const uint8_t* sps, size_t size, uint16_t* width, uint16_t* height);
