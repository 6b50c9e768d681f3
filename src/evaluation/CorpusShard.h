#pragma once

#include <cstddef>
#include <string>

namespace VeltoTouch {

// One of N parts of a corpus for an array job: part I (0 to N-1) takes the
// recordings at positions I, I+N, I+2N, ... of the list it is given, so that
// every part gets a share of every kind of recording and the parts together
// take each recording exactly once.
struct CorpusShard {
    std::size_t index = 0;
    std::size_t count = 1;

    // "I/N"; throws std::invalid_argument otherwise.
    static CorpusShard parse(const std::string& text);
    bool contains(std::size_t position) const noexcept { return position % count == index; }
    std::string text() const { return std::to_string(index) + "/" + std::to_string(count); }
};

}  // namespace VeltoTouch
