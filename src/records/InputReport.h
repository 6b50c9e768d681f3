#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

namespace VeltoTouch::InputReport {

inline constexpr std::size_t kPadCount = 15;

// One frame of the 15 pads. Report ID 0x01, 73 bytes, little-endian fields.
struct Image {
    static constexpr std::uint8_t kReportID = 0x01;
    static constexpr std::size_t kLength = 73;

    std::uint32_t frameNumber = 0;
    std::uint32_t timeMs = 0;
    std::uint8_t aux0 = 0;
    std::uint8_t aux1 = 0;
    std::uint8_t aux2 = 0;
    std::uint8_t aux3 = 0;
    std::array<std::uint16_t, kPadCount> levels{};
    std::array<std::int16_t, kPadCount> readings{};

    // A record when the buffer holds at least kLength bytes and starts with
    // kReportID; bytes past kLength are ignored. Reads nothing when too short.
    static std::optional<Image> parse(const std::uint8_t* data, std::size_t length) noexcept;
    // The kLength report bytes that parse back to this record, as a device
    // would send them; for simulated devices and tests.
    std::vector<std::uint8_t> toReport() const;
};

// A notice from the device firmware. Report ID 0x02, 10 bytes.
struct FirmwareEvent {
    static constexpr std::uint8_t kReportID = 0x02;
    static constexpr std::size_t kLength = 10;
    // The only code acted on: the device has reset.
    static constexpr std::uint8_t kEventDeviceReset = 0;

    std::uint8_t event = 0;
    std::array<std::uint8_t, 8> context{};

    // The context bytes as one number, first byte most significant, as
    // diagnostics print it.
    std::uint64_t contextValue() const noexcept;

    static std::optional<FirmwareEvent> parse(const std::uint8_t* data, std::size_t length) noexcept;
    std::vector<std::uint8_t> toReport() const;
};

}  // namespace VeltoTouch::InputReport
