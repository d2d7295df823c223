#include "capture/DumpFile.h"

#include "base/OrvexLog.h"

DumpFile::DumpFile(const char* tag, std::string internal, std::string external, long limit,
                   Texts texts, const std::atomic<bool>* quiet_unless)
    : m_tag(tag),
      m_internal(std::move(internal)),
      m_external(std::move(external)),
      m_limit(limit),
      m_texts(texts),
      m_quiet_unless(quiet_unless) {}

DumpFile::~DumpFile() { Close(); }

void DumpFile::Close() {
    thread_mutex::Scoped hold(m_lock);
    CloseLocked();
}

void DumpFile::CloseLocked() {
    if (m_file != nullptr) fclose(m_file);
    m_file = nullptr;
}

bool DumpFile::is_open() {
    thread_mutex::Scoped hold(m_lock);
    return m_file != nullptr;
}

void DumpFile::Say(const char* text) {
    if (m_quiet_unless != nullptr && !m_quiet_unless->load(std::memory_order_relaxed)) return;
    OrvexPrintLog(m_tag, "%s", text);
}

void DumpFile::Write(const void* data, size_t n, bool to_external) {
    thread_mutex::Scoped hold(m_lock);
    if (m_file == nullptr) {
        m_external_open = to_external;
        m_file = fopen(to_external ? m_external.c_str() : m_internal.c_str(), "wb");
        if (m_file == nullptr) {
            Say(to_external ? m_texts.open_failed_external : m_texts.open_failed_internal);
            return;
        }
    }
    if (!m_external_open && ftell(m_file) > m_limit) {
        CloseLocked();
        Say(remove(m_internal.c_str()) == 0 ? m_texts.removed : m_texts.remove_failed);
        m_file = fopen(m_internal.c_str(), "wb");
        if (m_file == nullptr) {
            Say(m_texts.reopen_failed);
            return;
        }
    }
    fwrite(data, 1, n, m_file);
}
