#pragma once

#include <atomic>
#include <cstdio>
#include <string>

#include "sync/thread_mutex.h"

// A debug dump: opened on the first write, in the removable-storage folder or the internal
// one; only the internal one has a size limit, past which the file starts over empty.
// Thread contract: Write and Close from any threads; each write lands whole in one file.
class DumpFile {
public:
    struct Texts {
        const char* open_failed_internal;
        const char* open_failed_external;
        const char* removed;
        const char* remove_failed;
        const char* reopen_failed;
    };

    // `internal`/`external` are the full paths; `limit` applies to `internal` only.
    // `quiet_unless` non-null: messages only while that switch is on.
    DumpFile(const char* tag, std::string internal, std::string external, long limit, Texts texts,
             const std::atomic<bool>* quiet_unless);
    ~DumpFile();
    DumpFile(const DumpFile&) = delete;
    DumpFile& operator=(const DumpFile&) = delete;

    void Write(const void* data, size_t n, bool to_external);
    void Close();
    bool is_open();

private:
    void Say(const char* text);
    void CloseLocked() ORVEX_REQUIRES(m_lock);

    const char* m_tag;
    std::string m_internal;
    std::string m_external;
    long m_limit;
    Texts m_texts;
    const std::atomic<bool>* m_quiet_unless;
    // Binder pool threads write the video dump together; a restart must not close the file
    // under another writer.
    thread_mutex m_lock;
    FILE* m_file ORVEX_GUARDED_BY(m_lock) = nullptr;
    bool m_external_open ORVEX_GUARDED_BY(m_lock) = false;
};
