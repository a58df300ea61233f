// Reads the files of packaging/ that describe velactl.
#pragma once

#include <fstream>
#include <gtest/gtest.h>
#include <regex>
#include <sstream>
#include <string>
#include <utility>

namespace vela {

inline std::string contentOf(const std::string& path) {
    std::ifstream stream(path, std::ios::binary);
    EXPECT_TRUE(stream.is_open()) << path;
    std::ostringstream content;
    content << stream.rdbuf();
    return content.str();
}

/// The text of a man page's source, without what escapes and fonts add.
inline std::string plainText(std::string roff) {
    for (const auto& [from, to] :
         {std::pair{R"(\\\(dq)", "\""}, {R"(\\e)", R"(\)"}, {R"(\\-)", "-"}, {R"(\\ )", " "}}) {
        roff = std::regex_replace(roff, std::regex(from), to);
    }
    return roff;
}

} // namespace vela
