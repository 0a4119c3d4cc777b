#include "contact_sheet.h"

#include <algorithm>
#include <cstring>

#include "time_arg.h"

namespace asfdump {

namespace {

// A 5x7 pixel font for the characters of a time ("1:02:03.500"); each row is
// five bits, the leftmost pixel in bit 4. Drawn into the sheet itself so that
// captions need no font file or library.
struct Glyph {
    char c;
    uint8_t rows[7];
};
constexpr Glyph kGlyphs[] = {
    {'0', {0x0E, 0x11, 0x13, 0x15, 0x19, 0x11, 0x0E}}, {'1', {0x04, 0x0C, 0x04, 0x04, 0x04, 0x04, 0x0E}},
    {'2', {0x0E, 0x11, 0x01, 0x02, 0x04, 0x08, 0x1F}}, {'3', {0x1F, 0x02, 0x04, 0x02, 0x01, 0x11, 0x0E}},
    {'4', {0x02, 0x06, 0x0A, 0x12, 0x1F, 0x02, 0x02}}, {'5', {0x1F, 0x10, 0x1E, 0x01, 0x01, 0x11, 0x0E}},
    {'6', {0x06, 0x08, 0x10, 0x1E, 0x11, 0x11, 0x0E}}, {'7', {0x1F, 0x01, 0x02, 0x04, 0x08, 0x08, 0x08}},
    {'8', {0x0E, 0x11, 0x11, 0x0E, 0x11, 0x11, 0x0E}}, {'9', {0x0E, 0x11, 0x11, 0x0F, 0x01, 0x02, 0x0C}},
    {':', {0x00, 0x0C, 0x0C, 0x00, 0x0C, 0x0C, 0x00}}, {'.', {0x00, 0x00, 0x00, 0x00, 0x00, 0x0C, 0x0C}},
    {'-', {0x00, 0x00, 0x00, 0x1F, 0x00, 0x00, 0x00}},
};
constexpr int kGlyphW = 5, kGlyphH = 7;
constexpr uint8_t kBackground = 0x20, kInk = 0xE8;

const Glyph* glyph(char c) {
    for (const Glyph& g : kGlyphs)
        if (g.c == c) return &g;
    return nullptr;
}

void draw_text(Image* sheet, int x, int y, int dot, const std::string& text) {
    for (char c : text) {
        if (const Glyph* g = glyph(c)) {
            for (int r = 0; r < kGlyphH; ++r)
                for (int col = 0; col < kGlyphW; ++col) {
                    if (!(g->rows[r] & (0x10 >> col))) continue;
                    for (int dy = 0; dy < dot; ++dy)
                        for (int dx = 0; dx < dot; ++dx) {
                            const int px = x + col * dot + dx, py = y + r * dot + dy;
                            if (px >= 0 && py >= 0 && px < sheet->width && py < sheet->height)
                                std::memset(sheet->pixel(px, py), kInk, 3);
                        }
                }
        }
        x += (kGlyphW + 1) * dot;
    }
}

constexpr int kGap = 4;

}  // namespace

SheetLayout SheetLayout::of(const std::vector<Tile>& tiles, int columns) {
    SheetLayout l;
    l.columns = std::max(1, std::min(columns, static_cast<int>(tiles.size())));
    if (tiles.empty()) return l;
    l.tile_width = tiles.front().image.width;
    l.caption_dot = l.tile_width >= 240 ? 2 : 1;
    int tallest = 0;
    for (const Tile& t : tiles) tallest = std::max(tallest, t.image.height);
    l.row_height = tallest + (kGlyphH + 4) * l.caption_dot;
    return l;
}

int SheetLayout::x(size_t index) const {
    return kGap + static_cast<int>(index % static_cast<size_t>(columns)) * (tile_width + kGap);
}

int SheetLayout::y(size_t index) const {
    return kGap + static_cast<int>(index / static_cast<size_t>(columns)) * (row_height + kGap);
}

Image compose_sheet(const std::vector<Tile>& tiles, const SheetLayout& l) {
    Image sheet;
    if (tiles.empty()) return sheet;
    sheet.width = kGap + l.columns * (l.tile_width + kGap);
    sheet.height = l.y(tiles.size() - 1) + l.row_height + kGap;
    sheet.rgb.assign(static_cast<size_t>(sheet.width) * sheet.height * 3, kBackground);
    const int tallest = l.row_height - (kGlyphH + 4) * l.caption_dot;
    for (size_t i = 0; i < tiles.size(); ++i) {
        const Image& img = tiles[i].image;
        const int x = l.x(i), y = l.y(i);
        const int copy_w = std::min(img.width, l.tile_width);
        for (int r = 0; r < img.height; ++r)
            std::memcpy(sheet.pixel(x, y + r), img.pixel(0, r), static_cast<size_t>(copy_w) * 3);
        draw_text(&sheet, x, y + tallest + 2 * l.caption_dot, l.caption_dot, format_time_us(tiles[i].pts));
    }
    return sheet;
}

}  // namespace asfdump
