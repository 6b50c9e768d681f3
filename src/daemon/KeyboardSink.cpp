#include "daemon/KeyboardSink.h"

namespace VeltoHost {

bool KeyboardSink::play(const KeyMap::Actions& actions)
{
    bool delivered = true;
    for (const KeyMap::Action& action : actions) {
        delivered = emitKey(action.code, action.pressed) && delivered;
        delivered = sync() && delivered;
    }
    return delivered;
}

}  // namespace VeltoHost
