#include "platform/spoor/FtraceInstance.h"

#include "platform/spoor/SystemFailure.h"

#include <array>
#include <cerrno>
#include <charconv>
#include <dirent.h>
#include <fcntl.h>
#include <string_view>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace vela::platform::spoor {

namespace {

constexpr std::size_t kInstances = 4;
constexpr mode_t kInstancePermissions = 0750;
/// The kernel rounds it up to what it needs at least.
constexpr std::size_t kColdKilobytes = 4;
/// Larger than any sub-buffer of an instance with the kernel's own choice of size.
constexpr std::size_t kLargestPage = 64 * 1024;
constexpr std::size_t kLargestText = 64 * 1024;

Result<std::string> textOf(const std::string& path) {
    const FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    std::string text;
    if (!file || !readToEnd(file, text, kLargestText)) {
        return systemFailure("read " + path, errno);
    }
    return text;
}

} // namespace

Result<std::unique_ptr<FtraceInstance>> FtraceInstance::open(const FtraceOptions& options) {
    Failure failure{ENOENT, "there is no trace file system"};
    for (const std::string& folder : options.traceFolders) {
        if (access((folder + "/instances").c_str(), F_OK) != 0) {
            continue;
        }
        auto taken = take(folder, options);
        if (taken) {
            return taken;
        }
        failure = taken.failure();
    }
    return failure;
}

Result<std::unique_ptr<FtraceInstance>> FtraceInstance::take(const std::string& folder, const FtraceOptions& options) {
    Failure failure{EBUSY, "all instances are other services'"};
    for (std::size_t i = 0; i < kInstances; ++i) {
        const std::string path = folder + "/instances/" + options.name + "-s" + std::to_string(i);
        if (mkdir(path.c_str(), kInstancePermissions) != 0 && errno != EEXIST) {
            return systemFailure("make " + path, errno);
        }
        std::unique_ptr<FtraceInstance> instance(new FtraceInstance());
        instance->folder_ = FileDescriptor(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        if (!instance->folder_) {
            return systemFailure("open " + path, errno);
        }
        if (flock(instance->folder_.get(), LOCK_EX | LOCK_NB) != 0) {
            continue;
        }
        instance->path_ = path;
        instance->marker_ = path + "/trace_marker_raw";
        instance->bufferKilobytes_ = options.bufferKilobytes;
        const Result<Done> configured = instance->configure(folder);
        if (configured) {
            return instance;
        }
        failure = configured.failure();
    }
    return failure;
}

Result<Done> FtraceInstance::write(const char* file, const std::string& text) const {
    const FileDescriptor opened(openat(folder_.get(), file, O_WRONLY | O_CLOEXEC));
    if (!opened || ::write(opened.get(), text.data(), text.size()) != static_cast<ssize_t>(text.size())) {
        return systemFailure("write " + path_ + "/" + file, errno);
    }
    return Done{};
}

Result<Done> FtraceInstance::configure(const std::string& folder) {
    const Result<std::string> page = textOf(folder + "/events/header_page");
    const Result<std::string> format = textOf(folder + "/events/ftrace/raw_data/format");
    if (!page || !format) {
        return page ? format.failure() : page.failure();
    }
    const auto layout = parseFtraceLayout(*page, *format);
    if (!layout) {
        return Failure{EPROTO, "the kernel describes its trace buffer in an unknown way"};
    }
    layout_ = *layout;
    const std::array<std::pair<const char*, std::string>, 5> settings{
        {{"tracing_on", "0"},
         {"trace_clock", "mono"},
         {"buffer_size_kb", std::to_string(kColdKilobytes)},
         {"options/overwrite", "1"},
         {"options/disable_on_free", "1"}}};
    for (const auto& [file, text] : settings) {
        if (Result<Done> written = write(file, text); !written) {
            return written;
        }
    }
    freeBuffer_ = FileDescriptor(openat(folder_.get(), "free_buffer", O_WRONLY | O_CLOEXEC));
    if (!freeBuffer_) {
        return systemFailure("open " + path_ + "/free_buffer", errno);
    }
    if (access(marker_.c_str(), W_OK) != 0) {
        return systemFailure("open " + marker_, errno);
    }
    page_.resize(kLargestPage);
    return Done{};
}

Result<Done> FtraceInstance::openPipes() {
    processors_.clear();
    FileDescriptor copy(openat(folder_.get(), "per_cpu", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const std::unique_ptr<DIR, int (*)(DIR*)> folder(fdopendir(copy.get()), &closedir);
    if (folder == nullptr) {
        return systemFailure("open " + path_ + "/per_cpu", errno);
    }
    copy.release();
    // A stream of its own: nobody else reads it meanwhile.
    while (const dirent* const entry = readdir(folder.get())) { // NOLINT(concurrency-mt-unsafe)
        const std::string_view name(&entry->d_name[0]);
        std::uint32_t number = 0;
        if (!name.starts_with("cpu") ||
            std::from_chars(name.data() + 3, name.data() + name.size(), number).ec != std::errc()) {
            continue;
        }
        const std::string file = "per_cpu/" + std::string(name) + "/trace_pipe_raw";
        FileDescriptor pipe(openat(folder_.get(), file.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
        if (!pipe) {
            return systemFailure("open " + path_ + "/" + file, errno);
        }
        processors_.push_back({number, std::move(pipe)});
    }
    return processors_.empty() ? Result<Done>(Failure{ENOENT, path_ + " has no processors"}) : Done{};
}

Result<Done> FtraceInstance::begin() {
    if (!warm_) {
        if (Result<Done> grown = write("buffer_size_kb", std::to_string(bufferKilobytes_)); !grown) {
            return grown;
        }
        warm_ = true;
    }
    // What an owner before this one left is emptied.
    const FileDescriptor trace(openat(folder_.get(), "trace", O_WRONLY | O_TRUNC | O_CLOEXEC));
    if (!trace) {
        return systemFailure("empty " + path_ + "/trace", errno);
    }
    if (Result<Done> opened = openPipes(); !opened) {
        return opened;
    }
    return write("tracing_on", "1");
}

void FtraceInstance::drain(std::vector<TraceRecord>& records, std::uint64_t& lost) {
    // A page for each of the buffer's and as many again: a reader that emitters outrun comes to an end.
    const std::size_t most = 2 * bufferKilobytes_ * 1024 / static_cast<std::size_t>(sysconf(_SC_PAGESIZE)) + 2;
    for (const Processor& processor : processors_) {
        for (std::size_t i = 0; i < most; ++i) {
            const ssize_t got = read(processor.pipe.get(), page_.data(), page_.size());
            if (got <= 0) {
                break;
            }
            lost = saturatingSum(lost, parseFtracePage({page_.data(), static_cast<std::size_t>(got)}, layout_,
                                                       processor.number, records));
        }
    }
}

void FtraceInstance::stop() { static_cast<void>(write("tracing_on", "0")); }

void FtraceInstance::end() { processors_.clear(); }

void FtraceInstance::cool() {
    if (std::exchange(warm_, false)) {
        static_cast<void>(write("buffer_size_kb", std::to_string(kColdKilobytes)));
    }
}

FtraceInstance::~FtraceInstance() {
    if (path_.empty()) {
        return;
    }
    stop();
    end();
    cool();
    freeBuffer_ = FileDescriptor();
    rmdir(path_.c_str());
}

} // namespace vela::platform::spoor
