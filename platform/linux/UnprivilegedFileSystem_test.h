// Lets tests that run as root see a service that may not change its user.
#pragma once

#include "platform/FileSystem.h"

#include <array>
#include <cstdint>
#include <linux/capability.h>
#include <memory>
#include <optional>
#include <string>
#include <sys/syscall.h>
#include <thread>
#include <unistd.h>
#include <utility>

namespace vela::platform {

/// Reads for others on a thread without the capabilities to become another user; all else as `inner` does.
class UnprivilegedFileSystem final : public FileSystem {
public:
    explicit UnprivilegedFileSystem(FileSystem& inner) : inner_(inner) {}

    /// Whether the calling thread may become another user.
    static bool isPrivileged() {
        Capabilities data{};
        return get(data) && (data[0].effective & kNeeded) == kNeeded;
    }
    /// False where the calling thread's capabilities cannot be changed.
    static bool dropPrivileges() {
        Capabilities data{};
        if (!get(data)) {
            return false;
        }
        data[0].effective &= ~kNeeded;
        __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
        return syscall(SYS_capset, &header, data.data()) == 0;
    }

    Result<std::string> readFileFor(const Identity& reader, const std::string& path, std::size_t limit) const override {
        std::optional<Result<std::string>> read;
        std::thread([&] {
            read.emplace(dropPrivileges() ? inner_.readFileFor(reader, path, limit)
                                          : Failure{0, "the thread keeps its capabilities"});
        }).join();
        return *std::move(read);
    }

    Result<std::string> readFile(const std::string& path, std::size_t limit) const override {
        return inner_.readFile(path, limit);
    }
    std::unique_ptr<PendingFile> createFile(const std::string& path, std::uint32_t permissions) override {
        return inner_.createFile(path, permissions);
    }
    Result<Done> createDirectories(const std::string& path, std::uint32_t permissions) override {
        return inner_.createDirectories(path, permissions);
    }
    std::string currentDirectory() const override { return inner_.currentDirectory(); }

private:
    using Capabilities = std::array<__user_cap_data_struct, _LINUX_CAPABILITY_U32S_3>;
    static constexpr std::uint32_t kNeeded = (1U << CAP_SETUID) | (1U << CAP_SETGID);

    static bool get(Capabilities& data) {
        __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
        return syscall(SYS_capget, &header, data.data()) == 0;
    }

    FileSystem& inner_;
};

} // namespace vela::platform
