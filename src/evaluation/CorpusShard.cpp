#include "evaluation/CorpusShard.h"

#include <charconv>
#include <stdexcept>

namespace VeltoTouch {

CorpusShard CorpusShard::parse(const std::string& text)
{
    CorpusShard shard;
    const char* const begin = text.data();
    const char* const end = begin + text.size();
    const auto [slash, indexError] = std::from_chars(begin, end, shard.index);
    bool valid = indexError == std::errc() && slash != end && *slash == '/';
    if (valid) {
        const auto [last, countError] = std::from_chars(slash + 1, end, shard.count);
        valid = countError == std::errc() && last == end && shard.count > 0 && shard.index < shard.count;
    }
    if (!valid) throw std::invalid_argument("--shard \"" + text + "\": expected I/N with 0 <= I < N");
    return shard;
}

}  // namespace VeltoTouch
