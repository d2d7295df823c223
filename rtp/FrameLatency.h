#pragma once

#include <cstddef>
#include <cstdint>

// What the video sender reports of its own share of a viewer's delay: for each frame, how long
// it waited in the ring (milliseconds from its ring time stamp to the start of sending) and how
// long sending all its packets took (microseconds); summed up as median and maximum once per
// window of kFrames. Fixed storage, so adding a frame allocates nothing. One thread.
class FrameLatency {
public:
    static constexpr size_t kFrames = 300;

    // Adds one frame. When that fills the window, writes the window's summary line to `line`,
    // starts a new window and returns true.
    bool Add(uint32_t ring_wait_ms, uint32_t send_us, char* line, size_t size);

private:
    uint32_t m_wait[kFrames];
    uint32_t m_send[kFrames];
    size_t m_count = 0;
};
