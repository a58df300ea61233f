// Names one group of the audio drivers' statistics channels. Immutable.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vela {

class VelaReportingDriver {
public:
    /// A part that is absent takes in any.
    static VelaReportingDriver driverWithGroupName(std::optional<std::string_view> groupName,
                                                   std::optional<std::string_view> subGroupName);

    const std::optional<std::string>& groupName() const { return groupName_; }
    const std::optional<std::string>& subGroupName() const { return subGroupName_; }

    /// "Haptics-Stats", "Tarn-(null)": what the driver's samples are stored under.
    std::string description() const;

private:
    VelaReportingDriver() = default;

    std::optional<std::string> groupName_;
    std::optional<std::string> subGroupName_;
};

/// "%@" of a driver.
void appendDescription(std::string& text, const VelaReportingDriver& driver);

} // namespace vela
