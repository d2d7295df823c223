#pragma once

#include <cstdint>
#include <functional>

// A consumer that starts watching asks for a key frame, so that it can show a whole picture at
// once instead of waiting out the encoder's interval. Requests are spaced at least
// kMinSpacingMs apart: many viewers joining together cost one key frame, not one each.
// Thread contract: any thread.
namespace stream {

constexpr uint64_t kKeyFrameMinSpacingMs = 500;

// True when a key frame was asked for now (false: one was asked for within the spacing, or the
// platform's recorder cannot be asked).
bool AskForKeyFrame();

// The spacing rule on its own, for tests: `last` holds the time of the last request (0: none).
bool KeyFrameDue(uint64_t now_ms, uint64_t* last);

}  // namespace stream
