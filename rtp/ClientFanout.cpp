#include "rtp/ClientFanout.h"

#include <netinet/udp.h>

// Older C libraries' headers (the television's among them) predate UDP segmentation (Linux
// 4.18); the option's number is the kernel's ABI, and an older kernel refuses it at the probe.
#ifndef UDP_SEGMENT
#define UDP_SEGMENT 103
#endif

#include <cerrno>
#include <cstring>

#include "base/OrvexLog.h"

unsigned PlanSegmentRuns(const unsigned* lengths, unsigned count, unsigned max_segments,
                         SegmentRun* runs) {
    if (max_segments == 0) max_segments = 1;
    unsigned n = 0, i = 0;
    while (i < count) {
        const unsigned size = lengths[i];
        unsigned j = i + 1;
        while (j < count && j - i < max_segments && lengths[j] == size) ++j;
        // The kernel cuts at `size`: only the last piece may be shorter.
        if (j < count && j - i < max_segments && lengths[j] < size) ++j;
        runs[n++] = SegmentRun{i, j - i, size};
        i = j;
    }
    return n;
}

ClientFanout::ClientFanout(int sockfd, bool stop_at_first_failure, const char* error_text)
    : sockfd_(sockfd),
      stop_at_first_failure_(stop_at_first_failure),
      error_text_(error_text),
      bytes_(new unsigned char[kFanoutBatchPackets * kRtpPacketMax]) {
    // Size 0 changes nothing (each send gives its own); only kernels since 4.18 take it.
    int none = 0;
    segment_ok_ = setsockopt(sockfd_, IPPROTO_UDP, UDP_SEGMENT, &none, sizeof none) == 0;
    memset(messages_, 0, sizeof messages_);
}

void ClientFanout::Report() { OrvexPrint("%s", error_text_); }

void ClientFanout::Send(const unsigned char* packet, unsigned length) {
    if (length > kRtpPacketMax) return;  // no packet builder makes one
    if (count_ == kFanoutBatchPackets) Flush();
    memcpy(bytes_.get() + used_, packet, length);
    offsets_[count_] = used_;
    lengths_[count_] = length;
    used_ += length;
    ++count_;
}

void ClientFanout::Flush() {
    if (count_ > 0 && targets_ != nullptr && !targets_->empty()) {
        if (targets_->size() == 1 && segment_ok_) {
            SendRuns();
        } else {
            SendEachToAll(0);
        }
    }
    count_ = 0;
    used_ = 0;
}

unsigned ClientFanout::SendMessages(unsigned from, unsigned n) {
    while (from < n) {
        int sent = sendmmsg(sockfd_, messages_ + from, n - from, 0);
        // After a partial send the error is lost: the next call meets it again on `from`.
        if (sent <= 0) return from;
        from += static_cast<unsigned>(sent);
    }
    return n;
}

void ClientFanout::SendEachToAll(unsigned first) {
    const std::vector<sockaddr_in>& to = *targets_;
    const unsigned each = static_cast<unsigned>(to.size());
    if (each > kMessages) {  // more clients than the service takes: one call per packet
        for (unsigned p = first; p < count_; ++p) {
            for (const sockaddr_in& a : to) {
                if (sendto(sockfd_, bytes_.get() + offsets_[p], lengths_[p], 0,
                           reinterpret_cast<const sockaddr*>(&a), sizeof a) < 0) {
                    Report();
                    if (stop_at_first_failure_) break;
                }
            }
        }
        return;
    }
    const unsigned per_call = kMessages / each;
    for (unsigned p = first; p < count_; p += per_call) {
        const unsigned packets = count_ - p < per_call ? count_ - p : per_call;
        unsigned n = 0;
        for (unsigned k = 0; k < packets; ++k) {
            for (const sockaddr_in& a : to) {
                iov_[n] = iovec{bytes_.get() + offsets_[p + k], lengths_[p + k]};
                msghdr& h = messages_[n].msg_hdr;
                h = msghdr{};
                h.msg_name = const_cast<sockaddr_in*>(&a);
                h.msg_namelen = sizeof a;
                h.msg_iov = &iov_[n];
                h.msg_iovlen = 1;
                ++n;
            }
        }
        unsigned at = 0;
        while ((at = SendMessages(at, n)) < n) {
            Report();
            // Video: the packet's later destinations are skipped, as sendto in order would.
            at = stop_at_first_failure_ ? (at / each + 1) * each : at + 1;
        }
    }
}

void ClientFanout::SendRuns() {
    const sockaddr_in& to = targets_->front();
    const unsigned n = PlanSegmentRuns(lengths_, count_, kSegmentsPerSend, runs_);
    for (unsigned m = 0; m < n; ++m) {
        const SegmentRun& run = runs_[m];
        const unsigned last = run.first + run.count - 1;
        iov_[m] = iovec{bytes_.get() + offsets_[run.first],
                        offsets_[last] + lengths_[last] - offsets_[run.first]};
        msghdr& h = messages_[m].msg_hdr;
        h = msghdr{};
        h.msg_name = const_cast<sockaddr_in*>(&to);
        h.msg_namelen = sizeof to;
        h.msg_iov = &iov_[m];
        h.msg_iovlen = 1;
        if (run.count > 1) {
            h.msg_control = control_[m];
            h.msg_controllen = sizeof control_[m];
            cmsghdr* c = CMSG_FIRSTHDR(&h);
            c->cmsg_level = IPPROTO_UDP;
            c->cmsg_type = UDP_SEGMENT;
            c->cmsg_len = CMSG_LEN(sizeof(uint16_t));
            const uint16_t size = static_cast<uint16_t>(run.size);
            memcpy(CMSG_DATA(c), &size, sizeof size);
        }
    }
    unsigned at = 0;
    while ((at = SendMessages(at, n)) < n) {
        if (runs_[at].count > 1) {
            // A device without checksum offload (EIO), a path whose MTU is below a segment
            // (EINVAL) or a kernel without the option: segmentation stays off from now on.
            if (errno == EIO || errno == EINVAL || errno == ENOPROTOOPT || errno == EOPNOTSUPP) {
                segment_ok_ = false;
            }
            // Whatever failed, the rest goes packet by packet, each failure reported once.
            SendEachToAll(runs_[at].first);
            return;
        }
        Report();
        ++at;
    }
}
