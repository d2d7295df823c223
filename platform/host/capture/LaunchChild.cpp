#include "platform/host/capture/LaunchChild.h"

#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <vector>

extern char** environ;

namespace platform {
namespace host {
namespace {

constexpr char kLauncher[] = "gst-launch-1.0";
constexpr size_t kTailBytes = 4096;
// A pipe as large as an unprivileged process may make: a 720p frame then crosses in two
// writes instead of sixteen.
constexpr int kPipeBytes = 1 << 20;

// A pipe whose ends sit at 10 and above, so that the child's dup2 onto 1, 2 and 3 never
// overwrites one end with the other.
bool HighPipe(UniqueFd* read_end, UniqueFd* write_end) {
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) return false;
    UniqueFd r(fds[0]), w(fds[1]);
    read_end->reset(fcntl(r.get(), F_DUPFD_CLOEXEC, 10));
    write_end->reset(fcntl(w.get(), F_DUPFD_CLOEXEC, 10));
    return read_end->valid() && write_end->valid();
}

// gst-launch-1.0 joins its arguments after escaping the spaces in each, so the description
// goes in as one argument per word, the words of a quoted value kept together.
std::vector<std::string> Words(const std::string& description) {
    std::vector<std::string> words;
    std::string word;
    bool quoted = false;
    for (size_t i = 0; i < description.size(); ++i) {
        char c = description[i];
        if (c == '\\' && i + 1 < description.size()) {
            word += c;
            word += description[++i];
            continue;
        }
        if (c == '"') quoted = !quoted;
        if (c == ' ' && !quoted) {
            if (!word.empty()) words.push_back(word);
            word.clear();
            continue;
        }
        word += c;
    }
    if (!word.empty()) words.push_back(word);
    return words;
}

std::string Trimmed(const std::string& s) {
    size_t b = s.find_first_not_of(" \t\r");
    if (b == std::string::npos) return std::string();
    return s.substr(b, s.find_last_not_of(" \t\r") + 1 - b);
}

}  // namespace

bool LaunchChild::start(const std::string& description, std::string* error) {
    stop();
    UniqueFd out_r, out_w, err_r, err_w;
    if (!HighPipe(&out_r, &out_w) || !HighPipe(&err_r, &err_w)) {
        *error = std::string("no pipe for ") + kLauncher + ": " + strerror(errno);
        return false;
    }
    fcntl(out_r.get(), F_SETPIPE_SZ, kPipeBytes);  // a smaller pipe only costs more writes
    fcntl(err_r.get(), F_SETFL, O_NONBLOCK);

    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, err_w.get(), 1);  // gst-launch's own messages
    posix_spawn_file_actions_adddup2(&actions, err_w.get(), 2);
    posix_spawn_file_actions_adddup2(&actions, out_w.get(), 3);
    posix_spawn_file_actions_addclosefrom_np(&actions, 4);
    // Its own process group keeps a terminal's Ctrl-C for the service, which stops the
    // child itself; no signal the service blocks or ignores is blocked or ignored there.
    posix_spawnattr_t attr;
    posix_spawnattr_init(&attr);
    sigset_t none, defaults;
    sigemptyset(&none);
    sigemptyset(&defaults);
    for (int s : {SIGPIPE, SIGINT, SIGTERM, SIGHUP, SIGCHLD}) sigaddset(&defaults, s);
    posix_spawnattr_setsigmask(&attr, &none);
    posix_spawnattr_setsigdefault(&attr, &defaults);
    posix_spawnattr_setpgroup(&attr, 0);
    posix_spawnattr_setflags(
        &attr, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETPGROUP);

    std::vector<std::string> words = Words(description);
    std::vector<char*> argv = {const_cast<char*>(kLauncher), const_cast<char*>("-q")};
    for (std::string& w : words) argv.push_back(&w[0]);
    argv.push_back(nullptr);
    pid_t pid = -1;
    int rc = posix_spawnp(&pid, kLauncher, &actions, &attr, argv.data(), environ);
    posix_spawnattr_destroy(&attr);
    posix_spawn_file_actions_destroy(&actions);
    if (rc != 0) {
        *error = std::string("cannot run ") + kLauncher +
                 " (Debian: gstreamer1.0-tools): " + strerror(rc);
        return false;
    }
    pid_ = pid;
    output_ = std::move(out_r);
    errors_ = std::move(err_r);
    tail_.clear();
    tail_.reserve(2 * kTailBytes);
    return true;
}

void LaunchChild::stop() {
    if (pid_ > 0) {
        kill(pid_, SIGKILL);  // it holds nothing that needs an orderly end
        while (waitpid(pid_, nullptr, 0) < 0 && errno == EINTR) {
        }
    }
    pid_ = -1;
    output_.reset();
    errors_.reset();
}

void LaunchChild::drainErrors() {
    if (!errors_.valid()) return;
    char buf[1024];
    ssize_t n;
    while ((n = read(errors_.get(), buf, sizeof buf)) > 0) {
        tail_.append(buf, static_cast<size_t>(n));
        if (tail_.size() > kTailBytes) tail_.erase(0, tail_.size() - kTailBytes);
    }
}

std::string LaunchChild::why() {
    int status = -1;
    if (pid_ > 0) {
        // The pipe ends a moment before the process is gone.
        for (int i = 0; i < 40; ++i) {
            pid_t done = waitpid(pid_, &status, WNOHANG);
            if (done == pid_ || (done < 0 && errno != EINTR)) {
                pid_ = -1;
                break;
            }
            status = -1;
            usleep(5000);
        }
    }
    drainErrors();
    return Reason(tail_, status);
}

std::string LaunchChild::Reason(const std::string& text, int status) {
    std::string first;
    size_t at = 0;
    while (at < text.size()) {
        size_t end = text.find('\n', at);
        if (end == std::string::npos) end = text.size();
        std::string line = Trimmed(text.substr(at, end - at));
        at = end + 1;
        // "ERROR: from element /GstPipeline:pipeline0/GstXImageSrc:ximagesrc0: <message>"
        static const char kError[] = "ERROR: from element ";
        if (line.compare(0, sizeof kError - 1, kError) == 0) {
            size_t colon = line.find(": ", sizeof kError - 1);
            if (colon != std::string::npos) return line.substr(colon + 2);
        }
        if (first.empty()) first = line;
    }
    if (!first.empty()) return first;
    if (status >= 0 && WIFSIGNALED(status)) {
        return std::string(kLauncher) + " ended by signal " + std::to_string(WTERMSIG(status));
    }
    if (status >= 0 && WIFEXITED(status)) {
        return std::string(kLauncher) + " exited with status " +
               std::to_string(WEXITSTATUS(status));
    }
    return std::string();
}

}  // namespace host
}  // namespace platform
