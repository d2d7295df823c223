#pragma once

#include <cstddef>
#include <cstdint>

// H.264 Annex B start codes (ITU-T H.264 B.1.1): the one scanner every layer uses.
// Thread contract: pure functions, any thread.

// Index of the first byte of the next 00 00 01 at or after `from`, or `size` when there is
// none. A 4-byte start code 00 00 00 01 is found one byte in, at its 00 00 01.
size_t FindStartCode(const uint8_t* data, size_t size, size_t from);

// Index of the next 00 00 00 01 at or after `from`, or `size`.
size_t FindFourByteStartCode(const uint8_t* data, size_t size, size_t from);

// Length of the start code at `p`: 4 for 00 00 00 01, 3 for 00 00 01, 0 for none.
size_t StartCodeLength(const uint8_t* p, size_t len);
