// A picture as asfdump's thumb command handles it: packed 8-bit RGB rows.
#pragma once

#include <cstdint>
#include <vector>

namespace asfdump {

struct Image {
    int width = 0;
    int height = 0;
    std::vector<uint8_t> rgb;  // width * 3 bytes a row, top row first

    uint8_t* pixel(int x, int y) { return rgb.data() + (static_cast<size_t>(y) * width + x) * 3; }
    const uint8_t* pixel(int x, int y) const {
        return rgb.data() + (static_cast<size_t>(y) * width + x) * 3;
    }
};

}  // namespace asfdump
