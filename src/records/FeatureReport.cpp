#include "records/FeatureReport.h"

#include "records/LittleEndian.h"

namespace VeltoTouch::FeatureReport {

std::optional<FactoryResetHoldDuration> FactoryResetHoldDuration::parse(const std::uint8_t* data,
                                                                        std::size_t length) noexcept
{
    if (length < kLength || data[0] != kReportID) return std::nullopt;
    return FactoryResetHoldDuration{LittleEndian::u32(data + 1)};
}

}  // namespace VeltoTouch::FeatureReport
