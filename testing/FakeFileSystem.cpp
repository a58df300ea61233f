#include "testing/FakeFileSystem.h"

#include <algorithm>
#include <cassert>
#include <cerrno>
#include <system_error>
#include <utility>

namespace vela::testing {

namespace {

platform::Failure failureOf(std::string_view operation, const std::string& path, int code) {
    return {code, std::string(operation) + " " + path + ": " + std::generic_category().message(code)};
}

/// Without slashes at its end; "/" stays.
std::string tidy(const std::string& path) {
    const auto last = path.find_last_not_of('/');
    return last == std::string::npos ? path.substr(0, 1) : path.substr(0, last + 1);
}

std::string folderOf(const std::string& path) {
    const auto slash = path.rfind('/');
    return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
}

/// By the three bits of the owner, the group or the others, whichever fits first; root may do everything.
bool allows(std::uint32_t permissions, std::uint32_t user, std::uint32_t group, const platform::Identity& reader,
            std::uint32_t right) {
    if (reader.user == 0) {
        return true;
    }
    const unsigned shift = reader.user == user ? 6 : (reader.isInGroup(group) ? 3 : 0);
    return ((permissions >> shift) & right) != 0;
}

} // namespace

class FakeFileSystem::Pending final : public platform::PendingFile {
public:
    Pending(FakeFileSystem& fileSystem, std::string path, std::uint32_t permissions)
        : fileSystem_(fileSystem),
          path_(std::move(path)),
          permissions_(permissions) {
        const MutexLock lock(fileSystem_.mutex_);
        const int error = fileSystem_.checkWritable(path_);
        fail(error == EISDIR ? 0 : error); // a folder in the file's place is met when the file gets its name
    }

    void append(std::string_view piece) override {
        if (!failure_) {
            fail(fileSystem_.checkPiece(path_, content_.size(), piece));
        }
        if (!failure_) {
            content_ += piece;
        }
    }

    const platform::Failure* failure() const override { return failure_ ? &*failure_ : nullptr; }

    platform::Result<platform::Done> commit() override {
        if (failure_) {
            return *failure_;
        }
        return fileSystem_.put(path_, std::move(content_), permissions_);
    }

private:
    void fail(int error) {
        if (error != 0) {
            failure_ = failureOf("write", path_, error);
        }
    }

    FakeFileSystem& fileSystem_;
    const std::string path_;
    const std::uint32_t permissions_;
    std::string content_;
    std::optional<platform::Failure> failure_; ///< the first
};

FakeFileSystem::FakeFileSystem() {
    const MutexLock lock(mutex_);
    nodes_["/"] = Node{std::nullopt, 0755};
}

void FakeFileSystem::addFile(const std::string& path, std::string content, std::uint32_t permissions) {
    const MutexLock lock(mutex_);
    [[maybe_unused]] const int error = makeFolders(folderOf(path), 0755);
    assert(error == 0);
    nodes_[path] = Node{std::move(content), permissions};
}

void FakeFileSystem::setCurrentDirectory(std::string path) {
    const MutexLock lock(mutex_);
    currentDirectory_ = std::move(path);
}

void FakeFileSystem::failOn(const std::string& path, int error) {
    const MutexLock lock(mutex_);
    errors_[path] = error;
}

void FakeFileSystem::limitFileSize(std::optional<std::size_t> bytes) {
    const MutexLock lock(mutex_);
    sizeLimit_ = bytes;
}

void FakeFileSystem::setObserver(std::function<void()> observer) {
    const MutexLock lock(mutex_);
    observer_ = std::move(observer);
}

std::optional<std::string> FakeFileSystem::contentOf(const std::string& path) const {
    const MutexLock lock(mutex_);
    const Node* const node = find(path);
    return node == nullptr ? std::nullopt : node->content;
}

std::optional<std::uint32_t> FakeFileSystem::permissionsOf(const std::string& path) const {
    const MutexLock lock(mutex_);
    const Node* const node = find(path);
    return node == nullptr ? std::nullopt : std::optional(node->permissions);
}

std::vector<std::string> FakeFileSystem::files() const {
    const MutexLock lock(mutex_);
    std::vector<std::string> paths;
    for (const auto& [path, node] : nodes_) {
        if (node.content) {
            paths.push_back(path);
        }
    }
    return paths;
}

std::size_t FakeFileSystem::longestPiece() const {
    const MutexLock lock(mutex_);
    return longestPiece_;
}

void FakeFileSystem::setOwner(const std::string& path, std::uint32_t user, std::uint32_t group) {
    const MutexLock lock(mutex_);
    Node& node = nodes_.at(path);
    node.user = user;
    node.group = group;
}

std::vector<platform::Identity> FakeFileSystem::readers() const {
    const MutexLock lock(mutex_);
    return readers_;
}

platform::Result<std::string> FakeFileSystem::readFile(const std::string& path, std::size_t limit) const {
    const MutexLock lock(mutex_);
    return read(path, limit);
}

platform::Result<std::string> FakeFileSystem::readFileFor(const platform::Identity& reader, const std::string& path,
                                                          std::size_t limit) const {
    const MutexLock lock(mutex_);
    readers_.push_back(reader);
    if (path.empty()) {
        return failureOf("open", path, EINVAL);
    }
    if (!mayRead(reader, path)) {
        return failureOf("open", path, EACCES);
    }
    return read(path, limit);
}

bool FakeFileSystem::mayRead(const platform::Identity& reader, const std::string& path) const {
    constexpr std::uint32_t kRead = 4;
    constexpr std::uint32_t kSearch = 1;
    for (std::string folder = path; folder.size() > 1;) {
        folder = folderOf(folder);
        const Node* const node = find(folder);
        if (node != nullptr && !allows(node->permissions, node->user, node->group, reader, kSearch)) {
            return false;
        }
    }
    const Node* const file = find(path);
    return file == nullptr || !file->content || allows(file->permissions, file->user, file->group, reader, kRead);
}

platform::Result<std::string> FakeFileSystem::read(const std::string& path, std::size_t limit) const {
    if (const int error = errorFor(path); error != 0) {
        return failureOf("read", path, error);
    }
    const Node* const node = find(path);
    if (node == nullptr) {
        return failureOf("open", path, ENOENT);
    }
    if (!node->content) {
        return platform::Failure{EISDIR, "read " + path + ": not a regular file"};
    }
    if (node->content->size() > limit) {
        return platform::Failure{EFBIG,
                                 "read " + path + ": larger than its limit of " + std::to_string(limit) + " bytes"};
    }
    return *node->content;
}

std::unique_ptr<platform::PendingFile> FakeFileSystem::createFile(const std::string& path, std::uint32_t permissions) {
    return std::make_unique<Pending>(*this, path, permissions);
}

int FakeFileSystem::checkPiece(const std::string& path, std::size_t size, std::string_view piece) {
    std::function<void()> observer;
    {
        const MutexLock lock(mutex_);
        observer = observer_;
    }
    if (observer) {
        observer();
    }
    const MutexLock lock(mutex_);
    longestPiece_ = std::max(longestPiece_, piece.size());
    if (const int error = checkWritable(path); error != 0) {
        return error;
    }
    return sizeLimit_ && size + piece.size() > *sizeLimit_ ? EFBIG : 0;
}

platform::Result<platform::Done> FakeFileSystem::put(const std::string& path, std::string content,
                                                     std::uint32_t permissions) {
    const MutexLock lock(mutex_);
    if (const int error = checkWritable(path); error != 0) {
        return failureOf("write", path, error);
    }
    nodes_[path] = Node{std::move(content), permissions};
    return platform::Done();
}

platform::Result<platform::Done> FakeFileSystem::createDirectories(const std::string& path, std::uint32_t permissions) {
    const MutexLock lock(mutex_);
    if (const int error = makeFolders(path, permissions); error != 0) {
        return failureOf("create folder", path, error);
    }
    return platform::Done();
}

std::string FakeFileSystem::currentDirectory() const {
    const MutexLock lock(mutex_);
    return currentDirectory_;
}

const FakeFileSystem::Node* FakeFileSystem::find(const std::string& path) const {
    const auto found = nodes_.find(path);
    return found == nodes_.end() ? nullptr : &found->second;
}

int FakeFileSystem::errorFor(const std::string& path) const {
    const auto found = errors_.find(path);
    return found == errors_.end() ? 0 : found->second;
}

int FakeFileSystem::makeFolders(const std::string& path, std::uint32_t permissions) {
    if (path.empty() || path.find('\0') != std::string::npos) {
        return EINVAL;
    }
    if (const int error = errorFor(path); error != 0) {
        return error;
    }
    const std::string whole = tidy(path);
    for (std::size_t end = whole.find('/', 1);; end = whole.find('/', end + 1)) {
        const std::string folder = whole.substr(0, end);
        const Node* const node = find(folder);
        if (node != nullptr && node->content) {
            return ENOTDIR;
        }
        if (node == nullptr) {
            nodes_[folder] = Node{std::nullopt, permissions};
        }
        if (end == std::string::npos) {
            return 0;
        }
    }
}

int FakeFileSystem::checkWritable(const std::string& path) const {
    if (path.empty() || path.ends_with('/') || path.find('\0') != std::string::npos) {
        return EINVAL;
    }
    if (const int error = errorFor(path); error != 0) {
        return error;
    }
    const Node* const folder = find(folderOf(path));
    if (folder == nullptr) {
        return ENOENT;
    }
    if (folder->content) {
        return ENOTDIR;
    }
    const Node* const old = find(path);
    return old != nullptr && !old->content ? EISDIR : 0;
}

} // namespace vela::testing
