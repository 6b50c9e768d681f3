#pragma once

#include "platform/values/PropertyValue.h"

#include <cstddef>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace VeltoHost {

// Dictionary with string keys that keeps insertion order, so that printed and
// written dictionaries list their entries the way they were built. Dictionaries
// here are small (a few dozen keys at most), so lookup is a linear scan.
class PropertyDictionary {
public:
    using Entry = std::pair<std::string, PropertyValue>;

    // Adds the entry at the end, or replaces the value of an existing key in place.
    void set(std::string key, PropertyValue value);
    // The value of the key, or an empty reference when the key is absent.
    PropertyValue get(std::string_view key) const;
    bool contains(std::string_view key) const;

    std::size_t size() const noexcept { return _entries.size(); }
    bool empty() const noexcept { return _entries.empty(); }
    auto begin() const noexcept { return _entries.begin(); }
    auto end() const noexcept { return _entries.end(); }

    // Equal when both hold the same keys with equal values, in any order.
    friend bool operator==(const PropertyDictionary& a, const PropertyDictionary& b) noexcept;

private:
    std::vector<Entry> _entries;
};

}  // namespace VeltoHost
