#pragma once
// MPEG-4 Part 2 video configuration: the VisualObjectLayer header inside a
// track's configuration bytes (alone, behind the visual object headers, or
// behind a BITMAPINFOHEADER).

#include <cstddef>
#include <cstdint>

#include "host/picture_shape.h"

namespace host {

// Finds the first VideoObjectLayer start code (00 00 01 20..2F) and reads its
// pixel aspect ratio and, for rectangular shapes, its size (0 otherwise).
// False when there is no such start code or the layer header is cut short.
bool ParseMpeg4VideoConfig(const uint8_t* config, size_t size, PictureShape* shape);

// The layer header's bits, starting just after its start code.
bool ParseMpeg4Vol(const uint8_t* vol, size_t size, PictureShape* shape);

}  // namespace host
