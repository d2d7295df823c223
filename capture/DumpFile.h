#pragma once

#include <cstdio>
#include <string>

// A debug dump: opened on the first write, in the removable-storage folder or the internal
// one; only the internal one has a size limit, past which the file starts over empty.
// Thread contract: NOT thread safe; written by one producer thread.
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
             const bool* quiet_unless);
    ~DumpFile();
    DumpFile(const DumpFile&) = delete;
    DumpFile& operator=(const DumpFile&) = delete;

    void Write(const void* data, size_t n, bool to_external);
    void Close();
    bool is_open() const { return m_file != nullptr; }

private:
    void Say(const char* text);

    const char* m_tag;
    std::string m_internal;
    std::string m_external;
    long m_limit;
    Texts m_texts;
    const bool* m_quiet_unless;
    FILE* m_file = nullptr;
    bool m_external_open = false;
};
