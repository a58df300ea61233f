// Runs a program to its end and keeps what it printed, for tests of whole programs.
#pragma once

#include "testing/TemporaryFolder.h"

#include <array>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

namespace vela::testing {

struct ProgramRun {
    int status = -1; ///< exit status; 128 and the signal's number for a program that a signal ended
    std::string out;
    std::string error;
};

/// `text` as one word of the shell.
inline std::string shellWord(const std::string& text) {
    std::string word = "'";
    for (const char letter : text) {
        word += letter == '\'' ? "'\\''" : std::string(1, letter);
    }
    return word + "'";
}

/// `arguments` begins with the program's file; `environment` holds "NAME=value" texts and nothing else is inherited.
/// Standard input is empty.
inline ProgramRun runProgram(const std::vector<std::string>& arguments, const std::vector<std::string>& environment) {
    const TemporaryFolder folder;
    std::string command = "exec env -i";
    for (const auto* words : {&environment, &arguments}) {
        for (const std::string& word : *words) {
            command += " " + shellWord(word);
        }
    }
    command += " </dev/null 2>" + shellWord(folder / "error");
    ProgramRun run;
    std::FILE* stream = popen(command.c_str(), "r"); // NOLINT(cert-env33-c): every word is quoted
    if (stream == nullptr) {
        return run;
    }
    std::array<char, 4096> block{};
    for (std::size_t count = 1; count > 0;) {
        count = std::fread(block.data(), 1, block.size(), stream);
        run.out.append(block.data(), count);
    }
    const int status = pclose(stream);
    run.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    std::ostringstream error;
    error << std::ifstream(folder / "error").rdbuf();
    run.error = error.str();
    return run;
}

} // namespace vela::testing
