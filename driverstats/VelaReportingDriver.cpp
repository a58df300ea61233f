#include "driverstats/VelaReportingDriver.h"

#include "common/TextFormat.h"

namespace vela {

VelaReportingDriver VelaReportingDriver::driverWithGroupName(std::optional<std::string_view> groupName,
                                                             std::optional<std::string_view> subGroupName) {
    VelaReportingDriver driver;
    driver.groupName_ = groupName;
    driver.subGroupName_ = subGroupName;
    return driver;
}

std::string VelaReportingDriver::description() const { return formatText("%@-%@", groupName_, subGroupName_); }

void appendDescription(std::string& text, const VelaReportingDriver& driver) { text += driver.description(); }

} // namespace vela
