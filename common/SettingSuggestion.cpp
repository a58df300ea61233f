#include "common/SettingSuggestion.h"

#include "common/SettingValues.h"
#include "common/SettingsTable.h"

#include <algorithm>
#include <array>
#include <numeric>

namespace vela {

namespace {

constexpr std::size_t kCompared = 64;

char lower(char letter) { return letter >= 'A' && letter <= 'Z' ? static_cast<char>(letter - 'A' + 'a') : letter; }

/// A third of the letters wrong is still a slip of the pen.
std::size_t tolerance(std::string_view name) { return std::max<std::size_t>(2, name.size() / 3); }

/// The nearest candidate so far.
class Nearest {
public:
    explicit Nearest(std::string_view name) : name_(name), distance_(tolerance(name) + 1) {}

    void offer(const std::string& candidate, std::size_t distance) {
        if (distance < distance_) {
            distance_ = distance;
            candidate_ = candidate;
        }
    }
    void offer(const std::string& candidate) { offer(candidate, editDistance(name_, candidate)); }

    std::string text() const { return candidate_.empty() ? "" : "; did you mean " + candidate_ + "?"; }

private:
    std::string_view name_;
    std::size_t distance_;
    std::string candidate_;
};

} // namespace

std::size_t editDistance(std::string_view left, std::string_view right) {
    left = left.substr(0, kCompared);
    right = right.substr(0, kCompared);
    std::array<std::size_t, kCompared + 1> row{};
    std::iota(row.begin(), row.end(), std::size_t{0});
    for (std::size_t i = 0; i < left.size(); ++i) {
        std::size_t diagonal = row[0];
        row[0] = i + 1;
        for (std::size_t j = 0; j < right.size(); ++j) {
            const std::size_t replaced = diagonal + (lower(left[i]) == lower(right[j]) ? 0 : 1);
            diagonal = row[j + 1];
            row[j + 1] = std::min({replaced, row[j] + 1, row[j + 1] + 1});
        }
    }
    return row[right.size()];
}

std::string settingSuggestion(std::string_view section, std::string_view key) {
    const std::string name = std::string(section) + "." + std::string(key);
    Nearest nearest(name);
    for (const SettingDescription& setting : settingsTable()) {
        if (!isOpenSection(setting.section)) {
            nearest.offer(setting.name(), setting.key == key ? 1 : editDistance(name, setting.name()));
        }
    }
    return nearest.text();
}

std::string sectionSuggestion(std::string_view section) {
    Nearest nearest(section);
    for (const SettingDescription& setting : settingsTable()) {
        nearest.offer(std::string(setting.section));
    }
    return nearest.text();
}

std::string displayedName(std::string_view name) {
    const std::string quoted = shownValue(std::string(name));
    return quoted.substr(1, quoted.size() - 2);
}

} // namespace vela
