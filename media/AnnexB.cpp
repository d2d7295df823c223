#include "media/AnnexB.h"

size_t FindStartCode(const uint8_t* data, size_t size, size_t from) {
    for (size_t i = from; i + 3 <= size; ++i) {
        if (data[i + 2] > 1) {
            i += 2;  // no start code can begin at i, i + 1 or i + 2
        } else if (data[i] == 0 && data[i + 1] == 0 && data[i + 2] == 1) {
            return i;
        }
    }
    return size;
}

size_t FindFourByteStartCode(const uint8_t* data, size_t size, size_t from) {
    for (size_t at = FindStartCode(data, size, from + 1); at < size;
         at = FindStartCode(data, size, at + 1)) {
        if (data[at - 1] == 0) return at - 1;
    }
    return size;
}

size_t StartCodeLength(const uint8_t* p, size_t len) {
    if (len >= 4 && p[0] == 0 && p[1] == 0 && p[2] == 0 && p[3] == 1) return 4;
    if (len >= 3 && p[0] == 0 && p[1] == 0 && p[2] == 1) return 3;
    return 0;
}
