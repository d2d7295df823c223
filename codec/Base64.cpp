#include "codec/Base64.h"

void Base64Encode(const unsigned char* data, unsigned int length, std::string& out) {
    static const char kAlphabet[] =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    out.clear();
    if (data == nullptr) return;
    out.reserve((length + 2) / 3 * 4);
    unsigned i = 0;
    for (; i + 2 < length; i += 3) {
        unsigned v = (unsigned{data[i]} << 16) | (unsigned{data[i + 1]} << 8) | data[i + 2];
        out += kAlphabet[v >> 18];
        out += kAlphabet[(v >> 12) & 63];
        out += kAlphabet[(v >> 6) & 63];
        out += kAlphabet[v & 63];
    }
    if (i < length) {
        unsigned v = unsigned{data[i]} << 16;
        if (i + 1 < length) v |= unsigned{data[i + 1]} << 8;
        out += kAlphabet[v >> 18];
        out += kAlphabet[(v >> 12) & 63];
        out += i + 1 < length ? kAlphabet[(v >> 6) & 63] : '=';
        out += '=';
    }
}
