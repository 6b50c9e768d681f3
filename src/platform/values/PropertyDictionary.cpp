#include "platform/values/PropertyDictionary.h"

#include <algorithm>

namespace VeltoHost {

void PropertyDictionary::set(std::string key, PropertyValue value)
{
    for (Entry& entry : _entries) {
        if (entry.first == key) {
            entry.second = std::move(value);
            return;
        }
    }
    _entries.emplace_back(std::move(key), std::move(value));
}

PropertyValue PropertyDictionary::get(std::string_view key) const
{
    for (const Entry& entry : _entries) {
        if (entry.first == key) return entry.second;
    }
    return {};
}

bool PropertyDictionary::contains(std::string_view key) const
{
    return std::any_of(_entries.begin(), _entries.end(), [key](const Entry& entry) { return entry.first == key; });
}

bool operator==(const PropertyDictionary& a, const PropertyDictionary& b) noexcept
{
    if (a.size() != b.size()) return false;
    for (const auto& [key, value] : a) {
        if (!b.contains(key) || !(b.get(key) == value)) return false;
    }
    return true;
}

}  // namespace VeltoHost
