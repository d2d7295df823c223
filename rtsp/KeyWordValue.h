#pragma once

#include <string>

// Knuth-Morris-Pratt search: the index of the first `pattern` in `text`, or -1 (an empty text
// gives -1, or 0 when the pattern is empty too). Prints its failure table on every call.
int kmp(const char* text, const char* pattern);

// The value after `key` (which includes its '=', "width=") in a URL query: up to '&', the end,
// or 10 characters. "failed" when the key is absent or at the very start of the URL.
std::string getKeyWordValue(std::string key, std::string url);
