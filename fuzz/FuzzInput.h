#pragma once

// Helpers shared by the fuzz targets: a reader that turns the fuzzer's bytes
// into typed fields, and a check that stops the run with a readable reason.

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

// A broken property is a finding like a crash: libFuzzer keeps the input that
// aborted. The message says which property broke, so the crash log alone tells
// what to look for.
#define VELTO_FUZZ_CHECK(condition)                                                                        \
    do {                                                                                                   \
        if (!(condition)) {                                                                                \
            std::fprintf(stderr, "%s:%d: property broken: %s\n", __FILE__, __LINE__, #condition);         \
            std::abort();                                                                                  \
        }                                                                                                  \
    } while (false)

namespace VeltoFuzz {

// Reads fields from the front of the fuzzer's input. Past the end every read
// yields zeros or nothing, so that any input decodes to some sequence of
// operations and the fuzzer never wastes an input on a format error.
class FuzzInput {
public:
    FuzzInput(const std::uint8_t* data, std::size_t size) : _data(data), _size(size) {}

    bool empty() const noexcept { return _position >= _size; }
    std::size_t remaining() const noexcept { return empty() ? 0 : _size - _position; }

    std::uint8_t byte() noexcept { return empty() ? 0 : _data[_position++]; }

    // A little-endian field of the type's width, zero-padded at the end.
    template <typename T>
    T number() noexcept
    {
        std::uint8_t raw[sizeof(T)] = {};
        for (std::uint8_t& b : raw) b = byte();
        T value;
        std::memcpy(&value, raw, sizeof value);
        return value;
    }

    // Up to `count` bytes, fewer when the input ends.
    std::vector<std::uint8_t> bytes(std::size_t count)
    {
        const std::size_t n = count < remaining() ? count : remaining();
        std::vector<std::uint8_t> out(_data + _position, _data + _position + n);
        _position += n;
        return out;
    }

    std::string text(std::size_t count)
    {
        const std::vector<std::uint8_t> raw = bytes(count);
        return std::string(raw.begin(), raw.end());
    }

    // Everything not read yet.
    std::vector<std::uint8_t> rest() { return bytes(remaining()); }

private:
    const std::uint8_t* _data;
    std::size_t _size;
    std::size_t _position = 0;
};

}  // namespace VeltoFuzz
