#include "platform/host/video/TestPattern.h"

#include <algorithm>
#include <cstring>

#include "platform/host/HostClock.h"

namespace platform {
namespace host {
namespace {

int Even(int v) { return v & ~1; }

struct Yuv {
    uint8_t y, u, v;
};

// 75% bars in studio range (BT.601): white, yellow, cyan, green, magenta, red, blue, black.
constexpr Yuv kBars[] = {{180, 128, 128}, {162, 44, 142}, {131, 156, 44}, {112, 72, 58},
                         {84, 184, 198},  {65, 100, 212}, {35, 212, 114}, {16, 128, 128}};
constexpr int kBarCount = sizeof kBars / sizeof kBars[0];

// Seven-segment digits; bit 0 is the top segment "a", then clockwise b..f, bit 6 the middle "g".
constexpr uint8_t kSegments[10] = {0x3F, 0x06, 0x5B, 0x4F, 0x66, 0x6D, 0x7D, 0x07, 0x7F, 0x6F};
// The labels in the same segments: "SUb" and "no SIGnAL" (0 is a blank).
constexpr uint8_t kSubGlyphs[] = {0x6D, 0x3E, 0x7C};
constexpr uint8_t kNoSignalGlyphs[] = {0x54, 0x5C, 0x00, 0x6D, 0x06, 0x3D, 0x54, 0x77, 0x38};

}  // namespace

TestPattern::TestPattern(int width, int height)
    : width_(std::max(2, Even(width))), height_(std::max(2, Even(height))) {
    bar_step_ = std::max(2, Even(width_ / 160));
    flash_size_ = std::max(2, Even(height_ / 6));
    flash_border_ = Even(flash_size_ / 8);
    flash_x_ = flash_border_;
    flash_y_ = flash_border_;
    digit_h_ = std::max(10, Even(height_ / 8));
    stroke_ = std::max(2, Even(digit_h_ / 6));
    digit_w_ = Even(digit_h_ / 2 + stroke_);
    int pad = 2 * stroke_;
    int plate_w = kDigits * digit_w_ + (kDigits + 1) * pad;
    counter_x_ = Even(width_ - plate_w - pad);
    counter_y_ = pad;
    // Cells of whole 8x8 blocks survive the encoder's quantisation best.
    stamp_cell_ = (width_ / 40) & ~7;
    if (stamp_cell_ < 8 || height_ < 8 * stamp_cell_) stamp_cell_ = 0;
    stamp_x_ = stamp_cell_;
    stamp_y_ = (height_ - 2 * stamp_cell_) & ~7;
}

size_t TestPattern::frameSize() const { return static_cast<size_t>(width_) * height_ * 3 / 2; }

void TestPattern::draw(uint32_t frame, uint64_t ms, uint8_t* i420, Label label) const {
    drawBars(frame, i420);
    drawCounter(frame, i420);
    drawLabel(label, i420);
    drawStamp(ms, i420);
    // Last, so that nothing on narrow pictures can cover the square the sync measurement reads.
    int outer = flash_size_ + 2 * flash_border_;
    fillRect(i420, 0, 0, outer, outer, kBlackY, kNeutralUV, kNeutralUV);
    if (InFlash(ms)) {
        fillRect(i420, flash_x_, flash_y_, flash_size_, flash_size_, kWhiteY, kNeutralUV,
                 kNeutralUV);
    }
}

void TestPattern::fillRect(uint8_t* i420, int x, int y, int w, int h, uint8_t yv, uint8_t u,
                           uint8_t v) const {
    // Even corners keep the chroma rectangle exactly under the luma one.
    int x0 = Even(std::max(0, x)), y0 = Even(std::max(0, y));
    int x1 = Even(std::min(width_, x + w)), y1 = Even(std::min(height_, y + h));
    if (x1 <= x0 || y1 <= y0) return;
    uint8_t* plane_y = i420;
    uint8_t* plane_u = plane_y + static_cast<size_t>(width_) * height_;
    uint8_t* plane_v = plane_u + static_cast<size_t>(width_ / 2) * (height_ / 2);
    for (int row = y0; row < y1; ++row) {
        memset(plane_y + static_cast<size_t>(row) * width_ + x0, yv, x1 - x0);
    }
    int cw = width_ / 2;
    for (int row = y0 / 2; row < y1 / 2; ++row) {
        memset(plane_u + static_cast<size_t>(row) * cw + x0 / 2, u, (x1 - x0) / 2);
        memset(plane_v + static_cast<size_t>(row) * cw + x0 / 2, v, (x1 - x0) / 2);
    }
}

void TestPattern::drawBars(uint32_t frame, uint8_t* i420) const {
    // Bars are vertical, so one row of each plane is worked out and copied down.
    int offset = static_cast<int>((static_cast<uint64_t>(frame) * bar_step_) % width_);
    uint8_t* plane_y = i420;
    for (int x = 0; x < width_; ++x) {
        int bar = (x + offset) % width_ * kBarCount / width_;
        plane_y[x] = kBars[bar].y;
    }
    for (int row = 1; row < height_; ++row) {
        memcpy(plane_y + static_cast<size_t>(row) * width_, plane_y, width_);
    }
    int cw = width_ / 2, ch = height_ / 2;
    uint8_t* plane_u = plane_y + static_cast<size_t>(width_) * height_;
    uint8_t* plane_v = plane_u + static_cast<size_t>(cw) * ch;
    for (int x = 0; x < cw; ++x) {
        int bar = (2 * x + offset) % width_ * kBarCount / width_;
        plane_u[x] = kBars[bar].u;
        plane_v[x] = kBars[bar].v;
    }
    for (int row = 1; row < ch; ++row) {
        memcpy(plane_u + static_cast<size_t>(row) * cw, plane_u, cw);
        memcpy(plane_v + static_cast<size_t>(row) * cw, plane_v, cw);
    }
}

void TestPattern::drawCounter(uint32_t frame, uint8_t* i420) const {
    int pad = 2 * stroke_;
    int plate_w = kDigits * digit_w_ + (kDigits + 1) * pad;
    fillRect(i420, counter_x_, counter_y_, plate_w, digit_h_ + 2 * pad, kBlackY, kNeutralUV,
             kNeutralUV);
    uint8_t glyphs[kDigits];
    uint32_t rest = frame;
    for (int i = kDigits - 1; i >= 0; --i, rest /= 10) glyphs[i] = kSegments[rest % 10];
    drawSegments(glyphs, kDigits, counter_x_ + pad, counter_y_ + pad, i420);
}

void TestPattern::drawSegments(const uint8_t* glyphs, int count, int x0, int y,
                               uint8_t* i420) const {
    int t = stroke_, w = digit_w_, h = digit_h_, pad = 2 * stroke_;
    int mid = Even((h - t) / 2);
    for (int i = 0; i < count; ++i) {
        uint8_t on = glyphs[i];
        int x = x0 + i * (w + pad);
        const int rects[7][4] = {
            {x, y, w, t},         {x + w - t, y, t, mid + t}, {x + w - t, y + mid, t, h - mid},
            {x, y + h - t, w, t}, {x, y + mid, t, h - mid},   {x, y, t, mid + t},
            {x, y + mid, w, t}};
        for (int s = 0; s < 7; ++s) {
            if (on & (1 << s)) {
                fillRect(i420, rects[s][0], rects[s][1], rects[s][2], rects[s][3], kWhiteY,
                         kNeutralUV, kNeutralUV);
            }
        }
    }
}

void TestPattern::drawLabel(Label label, uint8_t* i420) const {
    const uint8_t* glyphs = nullptr;
    int count = 0;
    if (label == Label::kSub) {
        glyphs = kSubGlyphs;
        count = sizeof kSubGlyphs;
    } else if (label == Label::kNoSignal) {
        glyphs = kNoSignalGlyphs;
        count = sizeof kNoSignalGlyphs;
    } else {
        return;
    }
    int pad = 2 * stroke_;
    int plate_w = count * digit_w_ + (count + 1) * pad, plate_h = digit_h_ + 2 * pad;
    int x = Even((width_ - plate_w) / 2), y = Even((height_ - plate_h) / 2);
    fillRect(i420, x, y, plate_w, plate_h, kBlackY, kNeutralUV, kNeutralUV);
    drawSegments(glyphs, count, x + pad, y + pad, i420);
}

void TestPattern::drawStamp(uint64_t ms, uint8_t* i420) const {
    const int c = stamp_cell_;
    if (c == 0) return;
    // A black plate half a cell wide around the row keeps the bars from bleeding into it.
    fillRect(i420, stamp_x_ - c / 2, stamp_y_ - c / 2, (kStampCells + 1) * c, 2 * c, kBlackY,
             kNeutralUV, kNeutralUV);
    const uint32_t stamp = static_cast<uint32_t>(ms);
    for (int i = 0; i < kStampCells; ++i) {
        bool white;
        if (i == 0 || i == kStampCells - 1) {
            white = true;
        } else if (i == 1 || i == kStampCells - 2) {
            white = false;
        } else {
            white = (stamp >> (kStampBits - 1 - (i - 2))) & 1u;
        }
        if (white) {
            fillRect(i420, stamp_x_ + i * c, stamp_y_, c, c, kWhiteY, kNeutralUV, kNeutralUV);
        }
    }
}

bool TestPattern::readStamp(const uint8_t* luma, uint32_t* ms) const {
    const int c = stamp_cell_;
    if (c == 0) return false;
    uint32_t stamp = 0;
    for (int i = 0; i < kStampCells; ++i) {
        // The middle half of the cell: its edges blur under compression.
        unsigned sum = 0;
        int x0 = stamp_x_ + i * c + c / 4, y0 = stamp_y_ + c / 4;
        for (int y = y0; y < y0 + c / 2; ++y) {
            for (int x = x0; x < x0 + c / 2; ++x) sum += luma[static_cast<size_t>(y) * width_ + x];
        }
        bool white = sum / static_cast<unsigned>((c / 2) * (c / 2)) > (kWhiteY + kBlackY) / 2;
        if (i == 0 || i == kStampCells - 1) {
            if (!white) return false;
        } else if (i == 1 || i == kStampCells - 2) {
            if (white) return false;
        } else {
            stamp = (stamp << 1) | (white ? 1u : 0u);
        }
    }
    *ms = stamp;
    return true;
}

}  // namespace host
}  // namespace platform
