// What every program does before anything else.
#pragma once

#include <fcntl.h>

namespace vela::platform {

/// Takes the places of standard input, output and error where they are closed: what the program opens next would stand
/// there, and get what is meant for the terminal. Reading and writing fail there as before.
inline void holdStandardDescriptors() {
    constexpr int kStandardDescriptors = 3;
    for (int descriptor = 0; descriptor < kStandardDescriptors; ++descriptor) {
        if (fcntl(descriptor, F_GETFD) < 0) {
            static_cast<void>(open("/dev/null", descriptor == 0 ? O_WRONLY : O_RDONLY)); // the lowest free: this one
        }
    }
}

} // namespace vela::platform
