#include "service/ServiceLog.h"

#include "common/TextFormat.h"
#include "common/values/Dictionary.h"
#include "common/values/TextualForm.h"

#include <algorithm>
#include <cstddef>

namespace vela {

namespace {

// Well below the longest log line, so that the count of what is left out is not cut off.
constexpr std::size_t kMostSessionBytes = 16 * 1024;
constexpr std::size_t kMostReporterIDs = 1'000;

void appendList(std::string& text, ArrayBuilder& list, std::size_t leftOut) {
    if (leftOut != 0) {
        list.add(std::string_view(formatText("and %zu more", leftOut)));
    }
    appendTextualForm(text, Value(list.build()));
}

} // namespace

void appendDescription(std::string& text, const VelaReportingSessionListText& list) {
    ArrayBuilder shown;
    std::size_t bytes = 0;
    for (const std::shared_ptr<VelaReportingSession>& session : list.sessions) {
        if (bytes >= kMostSessionBytes) {
            break;
        }
        const std::string description = session->description();
        bytes += description.size();
        shown.add(std::string_view(description));
    }
    appendList(text, shown, list.sessions.size() - shown.size());
}

void appendDescription(std::string& text, const VelaReportingReporterListText& list) {
    if (!list.reporterIDs) {
        text += "(null)";
        return;
    }
    ArrayBuilder shown;
    for (std::size_t index = 0; index < std::min(list.reporterIDs->size(), kMostReporterIDs); ++index) {
        shown.add((*list.reporterIDs)[index]);
    }
    appendList(text, shown, list.reporterIDs->size() - shown.size());
}

} // namespace vela
