#pragma once

#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/uio.h>

#include <cstdint>
#include <memory>
#include <vector>

#include "rtp/RtpPackets.h"

// At most this many packets wait for one Flush; a unit with more is sent in several batches.
constexpr unsigned kFanoutBatchPackets = 64;
// 32 × 1414 bytes (a full FU-A packet) = 45 248: inside the 64 KiB of one UDP datagram and the
// kernel's limit of 64 segments, which older kernels have.
constexpr unsigned kSegmentsPerSend = 32;

// A run of queued packets sent as one datagram the kernel cuts into `count` packets of `size`
// bytes (UDP_SEGMENT), the last one shorter or equal. A run of one is a plain packet.
struct SegmentRun {
    unsigned first;
    unsigned count;
    unsigned size;
};

// Cuts `count` packet lengths into runs in order: equal lengths, then at most one shorter, at
// most `max_segments` a run. Returns the number of runs written to `runs` (room for `count`).
unsigned PlanSegmentRuns(const unsigned* lengths, unsigned count, unsigned max_segments,
                         SegmentRun* runs);

// Sends packets to a list of destinations in order, each packet to every destination before the
// next packet, from one unbound socket. Send queues a copy; Flush sends the queue with as few
// system calls as it can: sendmmsg, and to a single destination UDP segmentation offload where
// the kernel has it (a kernel or device without it is noticed once and the packets go one by
// one). Video stops a packet at the first failing destination; audio goes on with the others.
// Each failed packet prints `error_text` once.
// Thread contract: the send thread that owns it. Allocates only when constructed.
class ClientFanout final : public PacketSink {
public:
    ClientFanout(int sockfd, bool stop_at_first_failure, const char* error_text);
    void SetTargets(const std::vector<sockaddr_in>& targets) { targets_ = &targets; }
    // Queues the packet (up to kRtpPacketMax bytes), sending the queue first when it is full.
    void Send(const unsigned char* packet, unsigned length) override;
    // Sends what is queued. Callers flush at the end of each unit, so nothing waits for the next.
    void Flush();
    bool segmenting() const { return segment_ok_; }

private:
    // Up to kMessages at once: a packet's destinations are never split between two calls.
    static constexpr unsigned kMessages = 64;
    void SendEachToAll(unsigned first);
    void SendRuns();
    // The messages [0, n): returns the index of the first that failed, or n.
    unsigned SendMessages(unsigned from, unsigned n);
    void Report();

    int sockfd_;
    bool stop_at_first_failure_;
    const char* error_text_;
    const std::vector<sockaddr_in>* targets_ = nullptr;
    bool segment_ok_;

    std::unique_ptr<unsigned char[]> bytes_;  // the queued packets, back to back
    unsigned used_ = 0;
    unsigned count_ = 0;
    unsigned offsets_[kFanoutBatchPackets];
    unsigned lengths_[kFanoutBatchPackets];
    SegmentRun runs_[kFanoutBatchPackets];
    mmsghdr messages_[kMessages];
    iovec iov_[kMessages];
    // One UDP_SEGMENT control message per message (a 16-bit size, padded to the header's
    // alignment).
    alignas(cmsghdr) unsigned char control_[kMessages][CMSG_SPACE(sizeof(uint16_t))];
};
