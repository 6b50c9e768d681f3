#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

namespace VeltoTouch {

// One per-frame column of a report, built value by value and handed to the
// page as base64 text. Integers are stored as the difference from the
// previous value, zigzag-mapped and written in 7-bit groups (LEB128), so a
// column that changes by little per frame costs one byte a frame; floats are
// stored as little-endian 32-bit IEEE numbers. The page decodes both.
class ColumnEncoder {
public:
    enum class Kind { DeltaVarint, Float32 };

    explicit ColumnEncoder(Kind kind) : _kind(kind) {}

    void pushInteger(std::int64_t value);
    void pushFloat(float value);

    Kind kind() const noexcept { return _kind; }
    std::size_t count() const noexcept { return _count; }
    std::string base64() const { return toBase64(_bytes); }

    static std::string toBase64(const std::string& bytes);

private:
    Kind _kind;
    std::string _bytes;
    std::int64_t _previous = 0;
    std::size_t _count = 0;
};

}  // namespace VeltoTouch
