// orvex-pattern: writes the host's test pattern, capture stamps included, as raw I420 frames to
// standard output at a steady rate, for a window to show on a screen that orvex captures: the
// stamp then measures the delay of screen capture as tools/rtsp_check.py latency reads it.

#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <vector>

#include "platform/host/video/TestPattern.h"

namespace {

uint64_t MonotonicNs() {
    timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<uint64_t>(ts.tv_sec) * 1000000000u + static_cast<uint64_t>(ts.tv_nsec);
}

bool WriteAll(const uint8_t* data, size_t size) {
    while (size > 0) {
        ssize_t n = write(STDOUT_FILENO, data, size);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        data += n;
        size -= static_cast<size_t>(n);
    }
    return true;
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 4) {
        fprintf(stderr, "usage: orvex-pattern WIDTH HEIGHT FPS > frames.i420\n");
        return 2;
    }
    const int width = atoi(argv[1]), height = atoi(argv[2]), fps = atoi(argv[3]);
    if (width < 16 || height < 16 || width % 2 != 0 || height % 2 != 0 || fps < 1 || fps > 120) {
        fprintf(stderr, "orvex-pattern: an even size of at least 16x16 and 1 to 120 fps\n");
        return 2;
    }
    platform::host::TestPattern pattern(width, height);
    std::vector<uint8_t> frame(pattern.frameSize());
    const uint64_t start = MonotonicNs();
    for (uint32_t n = 0;; ++n) {
        // Frame n is due at a fixed offset from the start, so that waits never add up to drift.
        const uint64_t due = start + static_cast<uint64_t>(n) * 1000000000u / fps;
        const uint64_t now = MonotonicNs();
        if (due > now) {
            timespec wait{static_cast<time_t>((due - now) / 1000000000u),
                          static_cast<long>((due - now) % 1000000000u)};
            nanosleep(&wait, nullptr);
        }
        // Stamped when drawn, in the clock the reader compares with.
        pattern.draw(n, MonotonicNs() / 1000000u, frame.data());
        if (!WriteAll(frame.data(), frame.size())) return 0;  // the reader has gone
    }
}
