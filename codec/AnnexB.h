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

// Calls f(nal, nal_len) for each NAL unit of an Annex B buffer, start codes (and the zero
// byte of a 4-byte start code that follows) left out; a buffer with no start code is one bare
// NAL unit. Empty NAL units are skipped.
// The same walk for as long as f(nal, nal_len) returns true: a reader that wants only what
// stands before the first slice stops there without scanning the rest.
template <typename F>
void ForEachNalUnitWhile(const uint8_t* data, size_t len, F&& f) {
    size_t pos = FindStartCode(data, len, 0);
    if (pos == len) {
        if (len > 0) f(data, len);
        return;
    }
    while (pos < len) {
        const size_t start = pos + 3;
        const size_t next = FindStartCode(data, len, start);
        size_t end = next;
        while (end > start && data[end - 1] == 0) --end;  // the next start code's leading zero
        if (end > start && !f(data + start, end - start)) return;
        pos = next;
    }
}

template <typename F>
void ForEachNalUnit(const uint8_t* data, size_t len, F&& f) {
    ForEachNalUnitWhile(data, len, [&f](const uint8_t* nal, size_t nal_len) {
        f(nal, nal_len);
        return true;
    });
}

// The raw AAC frame behind an ADTS header (7 bytes, 9 with a CRC), in place; a frame without
// the header's sync word is left as it is. False when no payload is left.
inline bool StripAdtsHeader(const uint8_t** data, size_t* len) {
    const uint8_t* p = *data;
    if (*len >= 7 && p[0] == 0xFF && (p[1] & 0xF6) == 0xF0) {
        const size_t header = (p[1] & 0x01) != 0 ? 7 : 9;  // protection_absent = 0: a CRC
        if (*len <= header) return false;
        *data = p + header;
        *len -= header;
    }
    return *len > 0;
}

// Whether a NAL unit (header byte first) that comes after a slice of the access unit being
// gathered begins the next one (H.264 7.4.1.2.3): an access unit delimiter, SEI, SPS, PPS or
// NAL types 14 to 18, or a slice whose first_mb_in_slice is 0 (a ue(v) 0 is a single 1 bit).
inline bool BeginsNextAccessUnit(const uint8_t* nal, size_t len) {
    if (len == 0) return false;
    const uint8_t type = nal[0] & 0x1F;
    if ((type >= 6 && type <= 9) || (type >= 14 && type <= 18)) return true;
    return (type == 1 || type == 5) && len > 1 && (nal[1] & 0x80) != 0;
}

// What kind of picture a slice NAL unit (header byte first) belongs to, for the gatherer's
// count of slices per kind: IDR by its NAL type, the others by slice_type (7.4.3) with SP
// counted as P and SI as I. kUnknown for other NAL types, a header cut short, or a
// slice_type over 9.
enum class SliceKind { kUnknown = -1, kIdr, kI, kP, kB };
SliceKind SliceKindOf(const uint8_t* nal, size_t len);
