#include "recording/PropertyValueBuilder.h"

#include <utility>

namespace VeltoTouch {

bool PropertyValueBuilder::key(std::string& key)
{
    _levels.back().key = std::move(key);
    return true;
}

bool PropertyValueBuilder::end_object()
{
    Level level = std::move(_levels.back());
    _levels.pop_back();
    return add(PropertyValue::dictionary(std::move(level.entries)));
}

bool PropertyValueBuilder::end_array()
{
    Level level = std::move(_levels.back());
    _levels.pop_back();
    return add(PropertyValue::array(std::move(level.items)));
}

bool PropertyValueBuilder::open(bool isObject)
{
    if (_levels.size() >= kMaxNestingDepth) {
        _problem = Problem::TooDeep;
        return false;
    }
    _levels.push_back(Level{isObject, {}, {}, {}});
    return true;
}

bool PropertyValueBuilder::scalar(PropertyValue value)
{
    if (_levels.empty() && !_scalarTopLevelAllowed) {
        _problem = Problem::ScalarAtTopLevel;
        return false;
    }
    return add(std::move(value));
}

bool PropertyValueBuilder::add(PropertyValue value)
{
    if (_levels.empty()) {
        _result = std::move(value);
        return true;
    }
    Level& level = _levels.back();
    if (level.isObject) {
        level.entries.set(std::move(level.key), std::move(value));
    } else {
        level.items.push_back(std::move(value));
    }
    return true;
}

}  // namespace VeltoTouch
