#pragma once
// What a video codec's configuration bytes say about the picture.

#include <cstdint>

namespace host {

struct PictureShape {
  uint32_t width = 0;   // displayed (cropped) size; 0 when the configuration does not say
  uint32_t height = 0;
  uint32_t aspect_width = 0;  // shape of one pixel; 0 and 0 when unspecified
  uint32_t aspect_height = 0;
};

}  // namespace host
