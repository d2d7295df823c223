#pragma once

#include <sys/types.h>

#include <string>

#include "platform/UniqueFd.h"

namespace platform {
namespace host {

// A GStreamer pipeline run by gst-launch-1.0 in a process of its own, writing what it makes
// to descriptor 3, which this side reads from a pipe. A library that ends its process when
// what it captures goes away (Xlib's exit when the X server closes the connection) then ends
// the child alone, and this side sees the end of the pipe.
// Thread contract: one thread at a time.
class LaunchChild {
public:
    LaunchChild() = default;
    ~LaunchChild() { stop(); }
    LaunchChild(const LaunchChild&) = delete;
    LaunchChild& operator=(const LaunchChild&) = delete;

    // Starts gst-launch-1.0 with `description`, which must end in "fdsink fd=3". False with
    // the reason when no process could be made.
    bool start(const std::string& description, std::string* error);
    // Kills and reaps the child and closes both pipes; nothing happens when none runs.
    void stop();

    pid_t pid() const { return pid_; }
    // The read end of the pipe the pipeline writes to, -1 when none runs. It stays owned here.
    int output() const { return output_.get(); }

    // Why the child ended, from what it wrote to its standard error: GStreamer's error text,
    // else the library's last words (for example Xlib's "fatal IO error"), else how the
    // process ended; empty when it is still running and said nothing. Reads what is waiting
    // without blocking; call once the output has ended.
    std::string why();

    // Keeps only the tail of what the child writes on its standard error, so that a chatty
    // child never blocks on a full pipe. Call now and then; it never blocks.
    void drainErrors();

    // The text to report for the child's standard error `text` and its wait status (or -1
    // while it runs): the first GStreamer error's message, else the last line, else the
    // status, else nothing.
    static std::string Reason(const std::string& text, int status);

private:
    pid_t pid_ = -1;
    UniqueFd output_;
    UniqueFd errors_;
    std::string tail_;
};

}  // namespace host
}  // namespace platform
