// orvex-feed: plays an H.264 Annex B stream into a running orvex on the host, one access unit
// per binder transaction, as the platform's media recorder would hand over encoded frames.

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "platform/BinderPort.h"
#include "platform/host/BinderWire.h"
#include "platform/host/HostBinder.h"
#include "tools/AccessUnitSplitter.h"

namespace {

constexpr const char* kService = "orvex.rtp";
constexpr uint32_t kEncodedFrameCode = 101;
constexpr size_t kReadSize = 256 * 1024;
// Input that never reaches a unit boundary within this much is not H.264 worth sending.
constexpr size_t kMaxPending = platform::host::HostBinder::kMaxTransactionSize;

using Clock = std::chrono::steady_clock;

void Usage(FILE* out) {
    fprintf(out,
            "usage: orvex-feed [--fps N] [--loop] [FILE|-]\n"
            "Sends an H.264 Annex B stream (default: standard input) to the running "
            "service,\none access unit per frame period (default 30 fps).\n");
}

struct Options {
    double fps = 30;
    bool loop = false;
    std::string input = "-";
};

// False on bad arguments.
bool ParseArgs(int argc, char** argv, Options* options) {
    bool have_input = false;
    for (int i = 1; i < argc; ++i) {
        std::string arg = argv[i];
        if (arg == "-h" || arg == "--help") {
            Usage(stdout);
            exit(0);
        } else if (arg == "--fps" && i + 1 < argc) {
            char* end = nullptr;
            errno = 0;
            options->fps = strtod(argv[++i], &end);
            if (errno != 0 || end == argv[i] || *end != '\0' || !(options->fps > 0) ||
                options->fps > 1000) {
                return false;
            }
        } else if (arg == "--loop") {
            options->loop = true;
        } else if ((arg == "-" || arg[0] != '-') && !have_input) {
            options->input = arg;
            have_input = true;
        } else {
            return false;
        }
    }
    return true;
}

class Feeder {
public:
    Feeder(platform::BinderPort& binder, double fps)
        : binder_(binder),
          period_(
              std::chrono::duration_cast<Clock::duration>(std::chrono::duration<double>(1 / fps))) {
    }

    // One access unit per frame period, one transaction per NAL unit. False once the service
    // is gone.
    bool Send(const std::vector<uint8_t>& unit) {
        Clock::time_point now = Clock::now();
        if (sent_ == 0) {
            next_ = now;
        } else if (now - next_ > std::chrono::seconds(1)) {
            // The input stalled (a live pipe): start a new schedule rather than burst to catch up.
            next_ = now;
        }
        std::this_thread::sleep_until(next_);
        next_ += period_;
        for (const tools::Span& nal : tools::NalUnitSpans(unit.data(), unit.size())) {
            if (!Transact(unit.data() + nal.begin, nal.end - nal.begin)) return false;
        }
        ++sent_;
        return true;
    }

    size_t sent() const { return sent_; }
    size_t refused() const { return refused_; }

private:
    bool Transact(const uint8_t* nal, size_t size) {
        parcel_.clear();
        parcel_.writeInt32(static_cast<int32_t>(size));
        parcel_.writeInplace(nal, size);
        parcel_.writeInt32(0);
        int status = binder_.transact(kService, kEncodedFrameCode, parcel_);
        if (status == platform::host::HostBinder::kDeadObject) {
            fprintf(stderr,
                    "orvex-feed: service %s is not there (%s; a service in another network "
                    "namespace is out of reach)\n",
                    kService,
                    platform::host::binder_wire::PrintablePath(
                        platform::host::HostBinder::ServicePath(
                            platform::host::HostBinder::BinderDir(), kService))
                        .c_str());
            return false;
        }
        if (status != platform::kBinderOk && refused_++ == 0) {
            fprintf(stderr, "orvex-feed: %s answered %d to a NAL unit of %zu bytes\n", kService,
                    status, size);
        }
        return true;
    }

    platform::ParcelWriter parcel_;
    platform::BinderPort& binder_;
    const Clock::duration period_;
    Clock::time_point next_;
    size_t sent_ = 0;
    size_t refused_ = 0;
};

// Streams one pass over `fd` into `feeder`. False when the service went away or reading failed.
bool FeedOnce(int fd, Feeder& feeder) {
    std::vector<uint8_t> pending;
    bool at_end = false;
    while (!at_end) {
        size_t have = pending.size();
        pending.resize(have + kReadSize);
        ssize_t n = read(fd, pending.data() + have, kReadSize);
        if (n < 0 && errno == EINTR) {
            pending.resize(have);
            continue;
        }
        if (n < 0) {
            fprintf(stderr, "orvex-feed: read: %s\n", strerror(errno));
            return false;
        }
        pending.resize(have + static_cast<size_t>(n));
        at_end = n == 0;
        size_t consumed = 0;
        auto units = tools::SplitAccessUnits(pending.data(), pending.size(), at_end, &consumed);
        for (const auto& unit : units) {
            if (!feeder.Send(unit)) return false;
        }
        pending.erase(pending.begin(), pending.begin() + static_cast<ptrdiff_t>(consumed));
        if (pending.size() > kMaxPending) {
            fprintf(stderr, "orvex-feed: no access unit boundary in %zu bytes; skipped\n",
                    pending.size());
            pending.clear();
        }
    }
    return true;
}

}  // namespace

int main(int argc, char** argv) {
    Options options;
    if (!ParseArgs(argc, argv, &options)) {
        Usage(stderr);
        return 2;
    }
    bool from_stdin = options.input == "-";
    if (from_stdin && options.loop) {
        fprintf(stderr, "orvex-feed: --loop needs a file\n");
        Usage(stderr);
        return 2;
    }
    int fd = from_stdin ? STDIN_FILENO : open(options.input.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        fprintf(stderr, "orvex-feed: %s: %s\n", options.input.c_str(), strerror(errno));
        return 1;
    }
    platform::host::HostBinder binder;
    Feeder feeder(binder, options.fps);
    bool ok = true;
    do {
        size_t before = feeder.sent();
        ok = FeedOnce(fd, feeder);
        if (ok && feeder.sent() == before) {
            fprintf(stderr, "orvex-feed: %s holds no H.264 access unit\n", options.input.c_str());
            ok = false;
        }
        if (ok && options.loop && lseek(fd, 0, SEEK_SET) != 0) {
            fprintf(stderr, "orvex-feed: cannot rewind %s: %s\n", options.input.c_str(),
                    strerror(errno));
            ok = false;
        }
    } while (ok && options.loop);
    if (!from_stdin) close(fd);
    fprintf(stderr, "orvex-feed: sent %zu access units", feeder.sent());
    if (feeder.refused() > 0) fprintf(stderr, ", %zu NAL units refused", feeder.refused());
    fprintf(stderr, "\n");
    return ok ? 0 : 1;
}
