#pragma once

#include "daemon/KeyMap.h"

namespace VeltoHost {

// Where key actions go: a virtual keyboard in the kernel, or anything that
// wants to see the same sequence (a test, a log).
//
// A receiver of input events sees nothing until a sync closes the frame, and
// a press and a release of one key inside the same frame may be merged away;
// play() therefore closes a frame after every action.
class KeyboardSink {
public:
    virtual ~KeyboardSink() = default;

    // false when the event could not be delivered; never throws.
    virtual bool emitKey(unsigned int code, bool pressed) = 0;
    virtual bool sync() = 0;

    // Each action in order, each in a frame of its own. Goes on past a failed
    // write so that a release still gets its chance; true when all went through.
    bool play(const KeyMap::Actions& actions);
};

}  // namespace VeltoHost
