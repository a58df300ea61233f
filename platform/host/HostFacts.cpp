#include "platform/host/HostFacts.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <fcntl.h>
#include <string_view>
#include <sys/stat.h>
#include <unistd.h>

namespace vela::platform {

namespace {

std::string parentOf(const std::string& path) {
    const std::size_t slash = path.find_last_of('/');
    return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
}

std::string withoutTrailingSlashes(std::string path) {
    while (path.size() > 1 && path.back() == '/') {
        path.pop_back();
    }
    return path;
}

bool isFolder(const struct stat& status) { return S_ISDIR(status.st_mode); }

bool mayUse(const std::string& path, int mode) { return faccessat(AT_FDCWD, path.c_str(), mode, AT_EACCESS) == 0; }

} // namespace

std::string environmentText(const char* name) {
    const char* text = std::getenv(name); // NOLINT(concurrency-mt-unsafe): nothing here changes the environment
    return text == nullptr ? "" : text;
}

SettingsEnvironment processEnvironment() {
    return {geteuid() != 0, environmentText("XDG_RUNTIME_DIR"), environmentText("XDG_STATE_HOME"),
            environmentText("HOME")};
}

FolderState folderState(const std::string& path) {
    std::string there = withoutTrailingSlashes(path);
    bool created = false;
    struct stat status {};
    while (stat(there.c_str(), &status) != 0) {
        if (errno != ENOENT || there == "/") {
            return errno == ENOTDIR ? FolderState::NoFolder : FolderState::CannotBeCreated;
        }
        created = true;
        there = withoutTrailingSlashes(parentOf(there));
    }
    if (!isFolder(status)) {
        return FolderState::NoFolder;
    }
    const bool writable = mayUse(there, W_OK | X_OK);
    if (created) {
        return writable ? FolderState::CanBeCreated : FolderState::CannotBeCreated;
    }
    return writable ? FolderState::Writable : FolderState::NotWritable;
}

std::optional<std::string> traceFolder() {
    for (const char* folder : {"/sys/kernel/tracing", "/sys/kernel/debug/tracing"}) {
        struct stat status {};
        if (stat((std::string(folder) + "/trace_marker").c_str(), &status) == 0) {
            return folder;
        }
    }
    return std::nullopt;
}

bool canMakeTraceInstances(const std::string& folder) {
    return folderState(folder + "/instances") == FolderState::Writable;
}

std::optional<std::string> findProgram(const std::string& name) {
    const std::string path = environmentText("PATH");
    std::string_view rest = path;
    while (!rest.empty()) {
        const std::string_view folder = rest.substr(0, rest.find(':'));
        rest.remove_prefix(std::min(folder.size() + 1, rest.size()));
        const std::string file = std::string(folder) + "/" + name;
        struct stat status {};
        if (folder.starts_with('/') && stat(file.c_str(), &status) == 0 && S_ISREG(status.st_mode) &&
            mayUse(file, X_OK)) {
            return file;
        }
    }
    return std::nullopt;
}

bool isTerminal(int descriptor) { return isatty(descriptor) == 1; }

/// The service manager names the stream's device and inode in JOURNAL_STREAM; a descriptor that was redirected since
/// has others.
bool isStandardErrorJournal() {
    const std::string stream = environmentText("JOURNAL_STREAM");
    struct stat status {};
    return !stream.empty() && fstat(STDERR_FILENO, &status) == 0 &&
           stream == std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

} // namespace vela::platform
