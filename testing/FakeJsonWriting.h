// JSON text that cannot be made when a test says so. Thread-safe.
#pragma once

#include "platform/JsonWriting.h"
#include "platform/Mutex.h"

#include <cstddef>
#include <optional>
#include <string>
#include <utility>

namespace vela::testing {

class FakeJsonWriting final : public platform::JsonWriting {
public:
    /// Every value fails with this description, or none does.
    void fail(std::optional<std::string> description) {
        const MutexLock lock(mutex_);
        failure_ = std::move(description);
    }

    platform::Result<platform::Done> append(std::string& text, ValueRef value, JsonLayout layout,
                                            std::size_t depth) const override {
        const MutexLock lock(mutex_);
        if (failure_) {
            text += "{ torn";
            return platform::Failure{0, *failure_};
        }
        appendJson(text, value, layout, depth);
        return platform::Done();
    }

private:
    mutable Mutex mutex_;
    std::optional<std::string> failure_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::testing
