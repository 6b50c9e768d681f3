#include "bus/DeviceControl.h"

namespace VeltoHost {

// Defined out of line so that the class's virtual table has one home.
DeviceControl::~DeviceControl() = default;

}  // namespace VeltoHost
