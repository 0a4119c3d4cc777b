// The contact sheet: tiles in rows, each with its time written below it.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "picture.h"

namespace asfdump {

struct Tile {
    int64_t pts = 0;  // microseconds
    Image image;
};

// Where tiles go: `columns` a row, left to right, each tile followed by its
// caption band; a gap between tiles and around the sheet.
struct SheetLayout {
    int columns = 1;
    int tile_width = 0;
    int row_height = 0;  // tallest tile plus its caption band
    int caption_dot = 1;  // pixel size of one dot of the caption font

    static SheetLayout of(const std::vector<Tile>& tiles, int columns);
    int x(size_t index) const;
    int y(size_t index) const;
};

// Tiles as the layout places them, all as wide as the first, each captioned
// with format_time_us of its time.
Image compose_sheet(const std::vector<Tile>& tiles, const SheetLayout& layout);

}  // namespace asfdump
