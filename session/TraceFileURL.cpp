#include "session/TraceFileURL.h"

#include <charconv>

namespace vela {

namespace {

constexpr std::string_view kScheme = "file://";

} // namespace

std::string pathOfFileURL(std::string_view url) {
    const std::size_t start = url.starts_with(kScheme) ? url.find('/', kScheme.size()) : std::string_view::npos;
    if (start == std::string_view::npos) {
        return std::string(url);
    }
    std::string path;
    for (std::size_t at = start; at < url.size(); ++at) {
        const std::string_view digits = url[at] == '%' ? url.substr(at + 1, 2) : std::string_view();
        unsigned char byte = 0;
        const char* const end = digits.data() + digits.size();
        if (digits.size() == 2 && std::from_chars(digits.data(), end, byte, 16).ptr == end) {
            path += static_cast<char>(byte);
            at += digits.size();
        } else {
            path += url[at];
        }
    }
    return path;
}

} // namespace vela
