#include "core/header/track_elements.h"

namespace {

using T = mkv_track_info;
using E = mkv_content_encoding;

constexpr track_element_rule track_element_rules[] = {
    {0xD7, track_rule::integer, {.integer = &T::track_number}},
    {0x73C5, track_rule::integer, {.integer = &T::track_uid}},
    {0x83, track_rule::track_type, {}},
    {0xB9, track_rule::flag, {.flag = &T::flag_enabled}},
    {0x88, track_rule::flag, {.flag = &T::flag_default}},
    {0x55AA, track_rule::flag, {.flag = &T::flag_forced}},
    {0x9C, track_rule::flag, {.flag = &T::flag_lacing}},
    {0x6DE7, track_rule::integer, {.integer = &T::min_cache}},
    {0x6DF8, track_rule::integer, {.integer = &T::max_cache}},
    {0x23E383, track_rule::integer, {.integer = &T::default_duration}},
    {0x23314F, track_rule::real, {.real = &T::track_timecode_scale}},
    {0x55EE, track_rule::integer, {.integer = &T::max_block_addition_id}},
    {0x536E, track_rule::text, {.text = &T::name}},
    {0x22B59C, track_rule::text, {.text = &T::language}},
    {0x86, track_rule::codec_id, {}},
    {0x63A2, track_rule::codec_private, {}},
    {0x258688, track_rule::text, {.text = &T::codec_name}},
    {0x7446, track_rule::integer, {.integer = &T::attachment_link}},
    {0xAA, track_rule::flag, {.flag = &T::codec_decode_all}},
    {0x6FAB, track_rule::integer, {.integer = &T::track_overlay}},

    {0xE0, track_rule::descend, {}},  // Video
    {0x9A, track_rule::flag, {.flag = &T::flag_interlaced}},
    {0x53B8, track_rule::integer, {.integer = &T::stereo_mode}},
    {0xB0, track_rule::integer, {.integer = &T::pixel_width}},
    {0xBA, track_rule::integer, {.integer = &T::pixel_height}},
    {0x54AA, track_rule::integer, {.integer = &T::pixel_crop_bottom}},
    {0x54BB, track_rule::integer, {.integer = &T::pixel_crop_top}},
    {0x54CC, track_rule::integer, {.integer = &T::pixel_crop_left}},
    {0x54DD, track_rule::integer, {.integer = &T::pixel_crop_right}},
    {0x54B0, track_rule::integer, {.integer = &T::display_width}},
    {0x54BA, track_rule::integer, {.integer = &T::display_height}},
    {0x54B2, track_rule::integer, {.integer = &T::display_unit}},
    {0x54B3, track_rule::integer, {.integer = &T::aspect_ratio_type}},
    {0x2EB524, track_rule::colour_space, {}},

    {0xE1, track_rule::descend, {}},  // Audio
    {0xB5, track_rule::real, {.real = &T::sampling_frequency}},
    {0x78B5, track_rule::real, {.real = &T::output_sampling_frequency}},
    {0x9F, track_rule::integer, {.integer = &T::channels}},
    {0x6264, track_rule::integer, {.integer = &T::bit_depth}},

    {0x6D80, track_rule::descend, {}},  // ContentEncodings
    {0x6240, track_rule::open_encoding, {}},
    {0x5031, track_rule::encoding_integer, {.encoding_integer = &E::order}},
    {0x5032, track_rule::encoding_integer, {.encoding_integer = &E::scope}},
    {0x5033, track_rule::encoding_integer, {.encoding_integer = &E::type}},
    {0x5034, track_rule::compression, {}},
    {0x4254, track_rule::encoding_integer, {.encoding_integer = &E::comp_algo}},
    {0x4255, track_rule::encoding_binary, {.encoding_binary = {&E::comp_settings, &E::comp_settings_size}}},
    {0x5035, track_rule::encryption, {}},
    {0x47E1, track_rule::encoding_integer, {.encoding_integer = &E::enc_algo}},
    {0x47E2, track_rule::encoding_binary, {.encoding_binary = {&E::enc_key_id, &E::enc_key_id_size}}},
    {0x47E3, track_rule::encoding_binary, {.encoding_binary = {&E::signature, &E::signature_size}}},
    {0x47E4, track_rule::encoding_binary, {.encoding_binary = {&E::sig_key_id, &E::sig_key_id_size}}},
    {0x47E5, track_rule::encoding_integer, {.encoding_integer = &E::sig_algo}},
    {0x47E6, track_rule::encoding_integer, {.encoding_integer = &E::sig_hash_algo}},
};

}  // namespace

const track_element_rule* find_track_element_rule(uint32_t id) {
  for (const track_element_rule& row : track_element_rules) {
    if (row.id == id) return &row;
  }
  return nullptr;
}
