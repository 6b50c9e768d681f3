#pragma once

#include <string>
#include <string_view>

namespace VeltoTouch::Util {

// Removes "<domain>." from the front of `key` when it is there (exact,
// case-sensitive) and returns true; otherwise leaves `key` alone and returns
// false. Dotted keys are resolved one domain at a time with it.
bool stripDomainFromKey(std::string& key, std::string_view domain);

}  // namespace VeltoTouch::Util
