#include "DescriptorWriteBuffer.h"

#include <unistd.h>

#include <cerrno>

namespace VeltoTool {

DescriptorWriteBuffer::DescriptorWriteBuffer(int descriptor) : _descriptor(descriptor)
{
    setp(_buffer.data(), _buffer.data() + _buffer.size());
}

DescriptorWriteBuffer::int_type DescriptorWriteBuffer::overflow(int_type c)
{
    if (!writeBuffered()) return traits_type::eof();
    if (traits_type::eq_int_type(c, traits_type::eof())) return traits_type::not_eof(c);
    *pptr() = traits_type::to_char_type(c);
    pbump(1);
    return c;
}

int DescriptorWriteBuffer::sync()
{
    return writeBuffered() ? 0 : -1;
}

bool DescriptorWriteBuffer::writeBuffered()
{
    if (_error != 0) return false;
    const char* next = pbase();
    while (next < pptr()) {
        const ssize_t written = ::write(_descriptor, next, static_cast<std::size_t>(pptr() - next));
        if (written > 0) {
            next += written;
        } else if (written < 0 && errno == EINTR) {
            // A stop signal (host) interrupts the write; the data still goes out.
            continue;
        } else {
            _error = written < 0 ? errno : EIO;
            return false;
        }
    }
    setp(_buffer.data(), _buffer.data() + _buffer.size());
    return true;
}

}  // namespace VeltoTool
