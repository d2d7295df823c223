#pragma once

#include <list>
#include <string>

#include "net/Tcp.h"

// RTSP text lines over a Tcp connection: reads request lines, writes header lines with their
// CR LF, queues the header fields of the next answer and splits rtsp:// URLs. With debug
// printing on, every line read and written is echoed to standard output (the protocol trace).
// Thread contract: NOT thread safe; used by its connection's thread.
class Rtsp : public Tcp {
public:
    Rtsp();

    using Socket::Read;
    using Socket::Write;
    // The text, then "\r\n"; an empty text sends only "\r\n". The first write's result.
    virtual int Write(std::string line);
    // One line without CR/LF: its length, 0 for an empty line (or ten quiet seconds), -1 when
    // the connection failed or closed. The byte after a CR is always dropped (the LF).
    virtual int Read(std::string& line);
    virtual void AddField(std::string field);
    virtual void WriteFields();
    // rtsp://host[:port]/path: outputs may be null. 1 on success, 0 (outputs untouched) if
    // the text holds no "rtsp://".
    virtual bool ParseMrl(std::string mrl, std::string* host, std::string* path, int* port);

protected:
    unsigned m_cseq = 0;
    int m_session_id = 0;
    std::list<std::string> m_fields;
};
