#pragma once

#include <cstdint>

// The decisions of the two send loops, apart from their I/O: media positions, the video's
// wait for the audio, pause and resume, RTP timestamps from item times, sequence and counter
// wraps. Thread contract: owned by one send thread.

// Video position in milliseconds from an RTP timestamp on clock `rate` (0 when unset).
unsigned PositionMs(uint32_t timestamp, unsigned rate);

// Advances `timestamp` by the time between the previous item and this one (`item_ms`); a time
// that went back leaves it as it is. The previous item time becomes `item_ms` either way.
void AdvanceTimestamp(uint32_t* timestamp, unsigned rate, uint32_t item_ms, uint32_t* last_item_ms);

class H264SendState {
public:
    enum Verdict { kSend, kDrop };

    // Video waits while it is 251 ms or more ahead of the audio (after two packets).
    bool MustWaitForAudio(unsigned video_ms, unsigned audio_ms) const;
    // True for the first item only.
    bool TakeFirstItem();
    // Counts the item's position and decides on pause and resume: after a pause, sending
    // restarts only at a position-0 item (the third item, then every 21st).
    Verdict Admit(bool paused);
    // After an item was sent: counters and the sequence restart at 1 from 65425.
    void AfterSend(uint16_t* sequence);

    unsigned position() const { return p_; }
    int resume_state() const { return resume_; }

private:
    uint32_t n_ = 0;  // items sent, wraps past 4294967293
    unsigned p_ = 0;  // position counter
    bool latched_ = false;
    int resume_ = 1;  // 1 sending, 2 paused, 3 waiting for a position-0 item
    bool first_ = true;
};

class AacSendState {
public:
    // Audio never waits; this only says whether the loop reports video lagging behind.
    bool VideoLags(unsigned audio_ms, unsigned video_ms) const;
    // After a packet: the sequence runs 0 to 65533, never 65534 or 65535.
    void AfterSend(uint16_t* sequence);

private:
    uint32_t n_ = 0;
};
