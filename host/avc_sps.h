#pragma once
// H.264 configuration as Matroska and MP4 carry it: the
// AVCDecoderConfigurationRecord and the sequence parameter set inside it.

#include <cstddef>
#include <cstdint>

#include "host/picture_shape.h"

namespace host {

// One SPS NAL unit, header byte included. Fills the cropped picture size and,
// when the VUI gives one, the sample aspect ratio. False when the unit is not
// an SPS, is cut short before the fields read, or holds out-of-range values.
bool ParseAvcSps(const uint8_t* nal, size_t size, PictureShape* shape);

// The first SPS of an AVCDecoderConfigurationRecord. False when the record is
// malformed or carries no SPS.
bool ParseAvcDecoderConfig(const uint8_t* record, size_t size, PictureShape* shape);

}  // namespace host
