#pragma once

#include <ostream>
#include <sstream>
#include <string>

// Collects what the code under test writes to std::cerr or std::cout, so that
// the exact diagnostic lines can be asserted. Restores the stream when gone.
class CaptureStream
{
public:
    explicit CaptureStream(std::ostream &stream)
        : m_stream(stream)
        , m_old(stream.rdbuf(m_buffer.rdbuf()))
    {
    }
    ~CaptureStream()
    {
        m_stream.rdbuf(m_old);
    }
    CaptureStream(const CaptureStream &) = delete;
    CaptureStream &operator=(const CaptureStream &) = delete;

    std::string text() const
    {
        return m_buffer.str();
    }

private:
    std::ostream &m_stream;
    std::ostringstream m_buffer;
    std::streambuf *m_old;
};
