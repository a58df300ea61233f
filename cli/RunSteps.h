// The lines of a file for `velactl run`. Pure.
#pragma once

#include "cli/Operations.h"
#include "common/values/Value.h"
#include "platform/Result.h"

#include <cstddef>
#include <iosfwd>
#include <vector>

namespace vela {

/// One line: a call or a pause.
struct RunStep {
    std::size_t line = 0;                 ///< from 1
    const Operation* operation = nullptr; ///< null for a pause
    std::vector<Value> arguments;
    double seconds = 0; ///< of a pause
};

/// All steps of JSON Lines, each tried out, so that nothing is sent of a file that has a fault. A failure's text goes
/// behind the file's name: ":2: there is no operation ...".
platform::Result<std::vector<RunStep>> readRunSteps(std::istream& in);

} // namespace vela
