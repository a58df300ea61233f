// An audio server of a test's own, without hardware, bus and anything remembered: two sinks ("speaker", the default,
// and "headphones") and a source ("microphone"). Everything it starts ends with it.
#pragma once

#include "testing/RunProgram.h"
#include "testing/RunningProgram.h"
#include "testing/TemporaryFolder.h"

#include <array>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <unistd.h>
#include <vector>

namespace vela::reporter {

class PrivateAudioServer {
public:
    /// The programs that are needed and not there; empty when all are.
    static std::string missingPrograms() {
        std::string missing;
        for (const char* const program :
             {"pipewire", "wireplumber", "pw-play", "pw-record", "pw-dump", "pw-cli", "pw-metadata"}) {
            if (access(programFile(program).c_str(), X_OK) != 0) {
                missing += (missing.empty() ? "" : ", ") + std::string(program);
            }
        }
        return missing;
    }

    PrivateAudioServer() {
        std::filesystem::copy(VELA_HEADLESS_CONFIGURATION, folder_ / "config",
                              std::filesystem::copy_options::recursive);
        for (const char* const below : {"home", "state"}) {
            std::filesystem::create_directory(folder_ / below);
        }
    }

    /// Whether it is ready to link streams.
    bool start() {
        server_.emplace(words({"pipewire"}), environment());
        return vela::testing::waitUntil([this] { return std::filesystem::exists(socket()); }) && startManager();
    }
    bool startManager() {
        manager_.emplace(words({"wireplumber"}), environment());
        return vela::testing::waitUntil([this] {
            return run({"pw-metadata", "0"}).out.find("key:'default.audio.sink' value:'{\"name\":\"speaker\"}'") !=
                   std::string::npos;
        });
    }
    void killServer() {
        server_->signal(SIGKILL);
        server_->waitForEnd();
        manager_.reset();
        // A server that is killed leaves its socket, which would look as if the next one were there.
        std::filesystem::remove(socket());
    }
    void killManager() { manager_.reset(); }

    std::string socket() const { return folder_ / "pipewire-0"; }
    std::string file(const std::string& name) const { return folder_ / name; }
    std::vector<std::string> environment() const {
        return {"PATH=/usr/bin:/bin",
                "HOME=" + (folder_ / "home"),
                "XDG_RUNTIME_DIR=" + folder_.path(),
                "XDG_CONFIG_HOME=" + (folder_ / "config"),
                "XDG_STATE_HOME=" + (folder_ / "state"),
                "LC_ALL=C.UTF-8"};
    }
    /// `arguments` begins with the program's name; it is started with the server's environment.
    std::vector<std::string> words(std::vector<std::string> arguments) const {
        arguments[0] = programFile(arguments[0]);
        return arguments;
    }
    vela::testing::ProgramRun run(const std::vector<std::string>& arguments) const {
        return vela::testing::runProgram(words(arguments), environment());
    }

    /// The object ID of the node of that name, once there is one.
    std::uint32_t nodeID(const std::string& name) const {
        std::uint32_t id = 0;
        EXPECT_TRUE(vela::testing::waitUntil([&] {
            for (const auto& object : nlohmann::json::parse(run({"pw-dump"}).out, nullptr, false)) {
                if (object.value("/info/props/node.name"_json_pointer, "") == name) {
                    id = object.value("id", 0U);
                }
            }
            return id != 0;
        })) << name;
        return id;
    }
    void setParameters(std::uint32_t node, const std::string& values) const {
        EXPECT_EQ(run({"pw-cli", "set-param", std::to_string(node), "Props", values}).status, 0);
    }
    void move(std::uint32_t node, const std::string& sink) const {
        EXPECT_EQ(run({"pw-metadata", std::to_string(node), "target.object", sink}).status, 0);
    }
    void forceRate(std::uint32_t rate) const {
        EXPECT_EQ(run({"pw-metadata", "-n", "settings", "0", "clock.force-rate", std::to_string(rate)}).status, 0);
    }

    /// A file of so many seconds of a quiet tone.
    std::string writeSound(std::uint32_t seconds) const {
        constexpr std::uint32_t kRate = 8000;
        const std::uint32_t bytes = seconds * kRate * 2;
        const auto number = [](std::uint32_t value, int size) {
            std::string text;
            for (int i = 0; i < size; ++i) {
                text += static_cast<char>(value >> (8 * static_cast<unsigned>(i)) & 0xFFU);
            }
            return text;
        };
        std::string sound = "RIFF" + number(36 + bytes, 4) + "WAVEfmt " + number(16, 4) + number(1, 2) + number(1, 2) +
                            number(kRate, 4) + number(kRate * 2, 4) + number(2, 2) + number(16, 2) + "data" +
                            number(bytes, 4);
        for (std::uint32_t i = 0; i < bytes / 2; ++i) {
            sound += number(i % 20 * 50, 2);
        }
        std::string path = folder_ / "sound.wav";
        std::ofstream(path, std::ios::binary) << sound;
        return path;
    }

private:
    static std::string programFile(const std::string& name) { return "/usr/bin/" + name; }

    const vela::testing::TemporaryFolder folder_;
    std::optional<vela::testing::RunningProgram> server_;
    std::optional<vela::testing::RunningProgram> manager_;
};

} // namespace vela::reporter
