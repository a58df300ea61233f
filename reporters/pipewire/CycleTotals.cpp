#include "reporters/pipewire/CycleTotals.h"

#include <algorithm>
#include <cstddef>

namespace vela::reporter {

void CycleTotals::Times::add(std::int64_t microseconds) {
    sum += microseconds;
    greatest = std::max(greatest, microseconds);
    const auto* const above = std::upper_bound(kTimeBounds.begin() + 1, kTimeBounds.end() - 1, microseconds);
    ++hits[static_cast<std::size_t>(above - kTimeBounds.begin() - 1)];
}

std::string CycleTotals::Times::text() const {
    std::string text;
    for (std::size_t i = 0; i < hits.size(); ++i) {
        if (hits[i] > 0) {
            text += (text.empty() ? "" : ",") + std::to_string(kTimeBounds[i]) + "-" +
                    std::to_string(kTimeBounds[i + 1]) + ":" + std::to_string(hits[i]);
        }
    }
    return text;
}

void CycleTotals::add(const std::optional<StatisticsSink::CycleTimes>& times) {
    if (!times) {
        ++incomplete_;
        return;
    }
    ++complete_;
    wait_.add(times->wait);
    busy_.add(times->busy);
}

std::vector<ReportField> CycleTotals::summary() const {
    std::vector<ReportField> fields{{"cycles", cycles()}, {"incomplete_cycles", incomplete_}};
    if (complete_ > 0) {
        fields.insert(fields.end(), {{"wait_mean_us", wait_.sum / complete_},
                                     {"wait_max_us", wait_.greatest},
                                     {"busy_mean_us", busy_.sum / complete_},
                                     {"busy_max_us", busy_.greatest}});
    }
    return fields;
}

std::vector<ReportField> CycleTotals::histograms() const {
    if (complete_ == 0) {
        return {};
    }
    return {{"wait_us", wait_.text()}, {"busy_us", busy_.text()}};
}

} // namespace vela::reporter
