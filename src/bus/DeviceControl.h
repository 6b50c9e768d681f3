#pragma once

#include "platform/values/PropertyValue.h"

#include <string>
#include <utility>

namespace VeltoHost {

// What a remote controller may do with one attached device: name it, read and
// write its service properties, save what it recorded. The bus service
// speaks to devices only through this, so that it knows nothing of how a
// device runs its plug-in.
//
// Calls come from one thread at a time (the bus service's worker). None may
// throw: a refusal is a Result the caller turns into an answer.
class DeviceControl {
public:
    enum class Status {
        Ok,
        // The request itself is wrong (unknown key, wrong kind of value, a
        // file that cannot take a recording); sending it again will not help.
        InvalidArgument,
        // The request was well formed but the device could not carry it out.
        Failed,
    };

    struct Result {
        Status status = Status::Ok;
        std::string message;  // for the person who sent the request; empty when Ok

        static Result ok() { return {}; }
        static Result invalidArgument(std::string message) { return {Status::InvalidArgument, std::move(message)}; }
        static Result failed(std::string message) { return {Status::Failed, std::move(message)}; }
        bool isOk() const noexcept { return status == Status::Ok; }
    };

    virtual ~DeviceControl();

    // How the device was found ("/dev/hidraw3", "sim:taps.json"); fixed for its life.
    virtual std::string name() const = 0;
    // On success `value` holds the property's current value.
    virtual Result getProperty(const std::string& key, PropertyValue& value) = 0;
    virtual Result setProperty(const std::string& key, const PropertyValue& value) = 0;
    // Writes the device's current recording into `file`, a descriptor of a
    // regular file open for writing, replacing what it held. The caller
    // keeps the descriptor.
    virtual Result saveRecording(int file) = 0;
};

}  // namespace VeltoHost
