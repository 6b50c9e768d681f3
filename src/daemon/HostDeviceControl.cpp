#include "daemon/HostDeviceControl.h"

#include "platform/devices/FileKind.h"
#include "records/DomainKey.h"
#include "recording/JsonValue.h"
#include "service/ServicePropertyKey.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <optional>

namespace VeltoHost {

namespace {

constexpr const char* kRecordingKey = "Recording";
// Keys that act when written and read as null: commands, not settings.
constexpr const char* kWriteOnlyKeys[] = {"Pipeline.Algs.ResetEventStats"};

bool isWriteOnly(const std::string& key)
{
    for (const char* writeOnly : kWriteOnlyKeys) {
        if (key == writeOnly) return true;
    }
    return false;
}

// Keys are echoed back to whoever sent them, cut short: the sender needs
// only enough to recognise what it sent.
constexpr std::size_t kQuotedKeyLimit = 80;

std::string quoted(const std::string& text)
{
    if (text.size() <= kQuotedKeyLimit) return "'" + text + "'";
    return "'" + text.substr(0, kQuotedKeyLimit) + "...'";
}

bool isIntegerType(PropertyValue::NumberType type)
{
    return type != PropertyValue::NumberType::Float32 && type != PropertyValue::NumberType::Float64;
}

// The exact value of an integral number, or nothing for a fraction or a
// value beyond 64 bits.
struct Integral {
    bool negative = false;
    std::uint64_t magnitude = 0;
};

bool integralOf(const PropertyValue& value, Integral& out)
{
    if (isIntegerType(value.numberType())) {
        if (value.numberType() == PropertyValue::NumberType::UInt64 ||
            value.numberType() == PropertyValue::NumberType::UInt32) {
            out = {false, value.toUInt64()};
            return true;
        }
        const std::int64_t signedValue = value.toInt64();
        out = {signedValue < 0, signedValue < 0 ? 0 - static_cast<std::uint64_t>(signedValue)
                                                : static_cast<std::uint64_t>(signedValue)};
        return true;
    }
    const double real = value.toDouble();
    if (!std::isfinite(real) || std::trunc(real) != real || std::fabs(real) >= 0x1p64) return false;
    out = {real < 0, static_cast<std::uint64_t>(std::fabs(real))};
    return true;
}

// Whether an integer setting of the current value's type can hold `value` unchanged.
bool fitsIntegerSetting(const PropertyValue& current, const PropertyValue& value)
{
    Integral integral;
    if (!integralOf(value, integral)) return false;
    switch (current.numberType()) {
    case PropertyValue::NumberType::UInt32:
        return !integral.negative && integral.magnitude <= std::numeric_limits<std::uint32_t>::max();
    case PropertyValue::NumberType::UInt64: return !integral.negative;
    case PropertyValue::NumberType::Int32:
        return integral.magnitude <= (integral.negative ? 0x80000000ull : 0x7FFFFFFFull);
    case PropertyValue::NumberType::Int64:
        return integral.magnitude <= (integral.negative ? 0x8000000000000000ull : 0x7FFFFFFFFFFFFFFFull);
    default: return true;
    }
}

// Why `file` cannot take a recording, or nothing. Only regular files: a
// device node or a pipe could block the writer or go somewhere the caller
// did not mean.
std::optional<std::string> unsuitable(int file)
{
    struct stat status {};
    if (::fstat(file, &status) != 0) return std::string("the file cannot be examined: ") + std::strerror(errno);
    if (!S_ISREG(status.st_mode)) return "the file is " + fileKind(status.st_mode) + ", not a regular file";
    const int flags = ::fcntl(file, F_GETFL);
    if (flags < 0 || (flags & O_ACCMODE) == O_RDONLY) return std::string("the file is not open for writing");
    if (flags & O_APPEND) return std::string("the file is open for appending; open it for writing from the start");
    return std::nullopt;
}

// The whole text at the start of `file`, and nothing after it.
int writeWhole(int file, const std::string& text)
{
    if (::ftruncate(file, 0) != 0) return errno;
    std::size_t written = 0;
    while (written < text.size()) {
        const ssize_t count = ::pwrite(file, text.data() + written, text.size() - written, static_cast<off_t>(written));
        if (count > 0) {
            written += static_cast<std::size_t>(count);
        } else if (count < 0 && errno != EINTR) {
            return errno;
        }
    }
    return 0;
}

bool isReadOnlyServiceKey(const std::string& key)
{
    for (const VeltoTouch::ServicePropertyKey& property : VeltoTouch::kServicePropertyKeys) {
        if (key == property.name) return !property.writable;
    }
    return false;
}

}  // namespace

HostDeviceControl::HostDeviceControl(std::string name, HostEventSystem& host) : _name(std::move(name)), _host(host)
{
}

PropertyValue HostDeviceControl::copy(const std::string& key)
{
    std::lock_guard guard(_hostLock);
    return _host.copyProperty(key);
}

bool HostDeviceControl::setPropertyUnchecked(const std::string& key, const PropertyValue& value)
{
    std::lock_guard guard(_hostLock);
    return _host.setProperty(key, value);
}

DeviceControl::Result HostDeviceControl::getProperty(const std::string& key, PropertyValue& value)
{
    if (key.empty()) return Result::invalidArgument("the property key is empty");
    if (!_host.isRunning()) return Result::failed("device " + _name + " is not running");
    value = copy(key);
    // Unknown keys read as null, so null is "nothing to read" rather than a value.
    if (!value.hasValue() || value.isNull()) return Result::invalidArgument("no readable property " + quoted(key));
    return Result::ok();
}

DeviceControl::Result HostDeviceControl::setProperty(const std::string& key, const PropertyValue& value)
{
    if (key.empty()) return Result::invalidArgument("the property key is empty");
    if (!_host.isRunning()) return Result::failed("device " + _name + " is not running");
    // Before the current value is copied: "Recording" is large.
    if (isReadOnlyServiceKey(key)) return Result::failed("property " + quoted(key) + " is read-only");
    if (!isWriteOnly(key)) {
        Result checked = checkWrite(key, copy(key), value);
        if (!checked.isOk()) return checked;
    }
    if (!setPropertyUnchecked(key, value)) return Result::failed("device " + _name + " refused the write of " + quoted(key));
    return Result::ok();
}

DeviceControl::Result HostDeviceControl::checkWrite(const std::string& key, const PropertyValue& current,
                                                    const PropertyValue& value) const
{
    if (!current.hasValue() || current.isNull()) return Result::invalidArgument("unknown property key " + quoted(key));
    if (!value.hasValue()) return Result::invalidArgument("no value given for " + quoted(key));
    // The recogniser's writable settings are all scalars; its dictionaries are
    // counters and diagnostics that a write would silently leave unchanged.
    std::string pipelineKey = key;
    if (VeltoTouch::Util::stripDomainFromKey(pipelineKey, VeltoTouch::kPipelineDomain) &&
        (current.isDictionary() || current.isArray())) {
        return Result::failed("property " + quoted(key) + " is read-only");
    }
    const std::string wrongKind =
        "property " + quoted(key) + " takes " + current.kindDescription() + ", not " + value.kindDescription();
    if (current.isBoolean()) {
        // A flag follows the boolean meaning of a number, as recorded sessions set it.
        return value.isNumberOrBoolean() ? Result::ok() : Result::invalidArgument(wrongKind);
    }
    if (current.isNumber()) {
        if (!value.isNumber()) return Result::invalidArgument(wrongKind);
        if (isIntegerType(current.numberType()) && !fitsIntegerSetting(current, value)) {
            return Result::invalidArgument("property " + quoted(key) + " takes an integer in the range of its type, not " +
                                           value.description());
        }
        return Result::ok();
    }
    if (current.kind() != value.kind()) return Result::invalidArgument(wrongKind);
    return Result::ok();
}

DeviceControl::Result HostDeviceControl::saveRecording(int file)
{
    if (const auto problem = unsuitable(file)) return Result::invalidArgument(*problem);
    if (!_host.isRunning()) return Result::failed("device " + _name + " is not running");
    const PropertyValue recording = copy(kRecordingKey);
    if (!recording.isString()) return Result::failed("device " + _name + " has no recording to save");
    if (const int error = writeWhole(file, recording.asString())) {
        return Result::failed(std::string("cannot write the recording: ") + std::strerror(error));
    }
    return Result::ok();
}

}  // namespace VeltoHost
