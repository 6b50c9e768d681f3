#pragma once

#include <array>
#include <streambuf>

namespace VeltoTool {

// A stream buffer over a file descriptor it does not own. It keeps the reason
// of the first write that failed (a full disk, a file-size limit), which a
// stream's state alone loses: errno has moved on by the time anyone asks.
class DescriptorWriteBuffer : public std::streambuf {
public:
    explicit DescriptorWriteBuffer(int descriptor);

    // 0 while every write has succeeded, else the errno of the first failure;
    // after one, every later write fails too, so that nothing goes out of order.
    int error() const { return _error; }

protected:
    int_type overflow(int_type c) override;
    int sync() override;

private:
    bool writeBuffered();

    static constexpr std::size_t kBufferSize = 64 << 10;
    int _descriptor;
    int _error = 0;
    std::array<char, kBufferSize> _buffer{};
};

}  // namespace VeltoTool
