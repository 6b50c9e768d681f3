#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>

namespace VeltoTouch::FeatureReport {

// The device's factory-reset hold duration. Feature report ID 0x1F, 5 bytes.
struct FactoryResetHoldDuration {
    static constexpr std::uint8_t kReportID = 0x1F;
    static constexpr std::size_t kLength = 5;

    std::uint32_t holdDuration = 0;

    static std::optional<FactoryResetHoldDuration> parse(const std::uint8_t* data, std::size_t length) noexcept;
};

}  // namespace VeltoTouch::FeatureReport
