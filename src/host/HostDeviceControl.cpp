#include "host/HostDeviceControl.h"

#include "recording/JsonValue.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <vector>

namespace VeltoHost {

namespace {

constexpr const char* kRecordingKey = "Recording";
constexpr const char* kPipelineDomain = "Pipeline.";
// Keys that act when written and read as null: commands, not settings.
constexpr const char* kWriteOnlyKeys[] = {"Pipeline.Algs.ResetEventStats"};
// Recordings hold raw touch data: readable by the daemon's group, no one else.
constexpr mode_t kRecordingFileMode = 0640;

bool isWriteOnly(const std::string& key)
{
    for (const char* writeOnly : kWriteOnlyKeys) {
        if (key == writeOnly) return true;
    }
    return false;
}

std::string quoted(const std::string& text) { return "'" + text + "'"; }

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

std::string systemError(const std::string& path, int error) { return "cannot write " + quoted(path) + ": " + std::strerror(error); }

// Writes beside the target and renames, so that a reader never finds half a
// recording and a failed save leaves an earlier file as it was.
DeviceControl::Result writeFileAtomically(const std::string& path, const std::string& text)
{
    std::vector<char> temporary(path.begin(), path.end());
    for (char c : std::string(".XXXXXX")) temporary.push_back(c);
    temporary.push_back('\0');
    const int fd = ::mkostemp(temporary.data(), O_CLOEXEC);
    if (fd < 0) return DeviceControl::Result::failed(systemError(path, errno));
    int error = ::fchmod(fd, kRecordingFileMode) == 0 ? 0 : errno;
    std::size_t written = 0;
    while (error == 0 && written < text.size()) {
        const ssize_t count = ::write(fd, text.data() + written, text.size() - written);
        if (count > 0) {
            written += static_cast<std::size_t>(count);
        } else if (count < 0 && errno != EINTR) {
            error = errno;
        }
    }
    if (::close(fd) != 0 && error == 0) error = errno;
    if (error == 0 && ::rename(temporary.data(), path.c_str()) != 0) error = errno;
    if (error != 0) {
        ::unlink(temporary.data());
        return DeviceControl::Result::failed(systemError(path, error));
    }
    return DeviceControl::Result::ok();
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
    if (key.rfind(kPipelineDomain, 0) == 0 && (current.isDictionary() || current.isArray())) {
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

DeviceControl::Result HostDeviceControl::saveRecording(const std::string& path)
{
    if (path.empty()) return Result::invalidArgument("the path is empty");
    // The daemon's working directory is no one's business; a relative path
    // would land somewhere the caller did not mean.
    if (path.front() != '/') return Result::invalidArgument("the path must be absolute, not " + quoted(path));
    if (path.back() == '/') return Result::invalidArgument("the path names a directory: " + quoted(path));
    if (!_host.isRunning()) return Result::failed("device " + _name + " is not running");
    const PropertyValue recording = copy(kRecordingKey);
    if (!recording.isString()) return Result::failed("device " + _name + " has no recording to save");
    return writeFileAtomically(path, recording.asString());
}

}  // namespace VeltoHost
