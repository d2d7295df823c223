#pragma once

#include <string>

// Standard Base64 (RFC 4648 §4 alphabet, "=" padding, no line breaks) of `length` bytes.
void Base64Encode(const unsigned char* data, unsigned int length, std::string& out);
