#pragma once

#include <cstddef>
#include <cstdint>

namespace platform {
namespace host {

// The host camera's synthetic picture, in I420: colour bars scrolling sideways, the frame
// number in large seven-segment digits (top right) and a square (top left) that is white while
// the host clock is in its flash window and black otherwise, so a viewer can measure A/V sync
// against the host's beeping tone; and, along the bottom, the capture time as a row of large
// black and white cells a decoder can read back after compression, so a viewer on the same
// machine can measure glass-to-glass delay.
// Thread contract: immutable after construction; draw may run on any thread concurrently.
class TestPattern {
public:
    // A word in the middle of the picture: the sub window's pattern says "SUb", and a source
    // that was lost mid-stream shows "no SIGnAL".
    enum class Label { kNone, kSub, kNoSignal };

    // Odd sizes are rounded down to even (I420 needs them even); at least 2x2.
    TestPattern(int width, int height);

    int width() const { return width_; }
    int height() const { return height_; }
    // Bytes of one frame: the Y plane, then U, then V, with no padding between rows.
    size_t frameSize() const;

    // Draws frame `frame` as captured at host clock time `ms` into `i420` (frameSize() bytes).
    // The picture depends on nothing else.
    void draw(uint32_t frame, uint64_t ms, uint8_t* i420, Label label = Label::kNone) const;

    // Where the flash square lies, in luma pixels.
    int flashX() const { return flash_x_; }
    int flashY() const { return flash_y_; }
    int flashSize() const { return flash_size_; }

    // The time stamp row: kStampCells square cells of stampCell() pixels from (stampX(),
    // stampY()): white, black, the low 32 bits of the capture time in milliseconds (most
    // significant first, white is 1), black, white. No row (stampCell() is 0) on pictures
    // narrower than 320 pixels or lower than eight cells.
    int stampCell() const { return stamp_cell_; }
    int stampX() const { return stamp_x_; }
    int stampY() const { return stamp_y_; }
    // Reads the stamp back from a picture of this size (luma plane only); false when the guard
    // cells are not where they belong.
    bool readStamp(const uint8_t* luma, uint32_t* ms) const;

    static constexpr uint8_t kWhiteY = 235;
    static constexpr uint8_t kBlackY = 16;
    static constexpr uint8_t kNeutralUV = 128;
    static constexpr int kDigits = 6;
    static constexpr int kStampBits = 32;
    static constexpr int kStampCells = kStampBits + 4;

private:
    void fillRect(uint8_t* i420, int x, int y, int w, int h, uint8_t yv, uint8_t u,
                  uint8_t v) const;
    void drawBars(uint32_t frame, uint8_t* i420) const;
    void drawCounter(uint32_t frame, uint8_t* i420) const;
    void drawSegments(const uint8_t* glyphs, int count, int x, int y, uint8_t* i420) const;
    void drawLabel(Label label, uint8_t* i420) const;
    void drawStamp(uint64_t ms, uint8_t* i420) const;

    int width_;
    int height_;
    int bar_step_;
    int flash_x_;
    int flash_y_;
    int flash_size_;
    int flash_border_;
    int digit_w_;
    int digit_h_;
    int stroke_;
    int counter_x_;
    int counter_y_;
    int stamp_cell_;
    int stamp_x_;
    int stamp_y_;
};

}  // namespace host
}  // namespace platform
