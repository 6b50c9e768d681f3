#include "records/DomainKey.h"

namespace VeltoTouch::Util {

bool stripDomainFromKey(std::string& key, std::string_view domain)
{
    if (key.size() <= domain.size() || key.compare(0, domain.size(), domain) != 0 || key[domain.size()] != '.') {
        return false;
    }
    key.erase(0, domain.size() + 1);
    return true;
}

}  // namespace VeltoTouch::Util
