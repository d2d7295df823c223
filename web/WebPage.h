#pragma once

#include <cstddef>

// The player page (web/page/index.html), built into the program so that it needs no files.
extern const unsigned char kWebPage[];  // NUL after the last byte
extern const size_t kWebPageSize;
