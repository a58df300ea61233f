// The channel files of a folder, sampled. What a file describes is read once and kept as long as the file is the same.
// Confined to its owner's lock.
#pragma once

#include "platform/hwstats/ChannelFileReader.h"
#include "platform/hwstats/Samples.h"
#include "platform/linux/FileDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <sys/stat.h>
#include <utility>
#include <vector>

namespace vela::platform::hwstats {

class ChannelFolder {
public:
    // What is beyond these is missed by a sampling, and sampled by none.
    static constexpr std::size_t kMostFiles = 256;
    static constexpr std::size_t kMostBytes = std::size_t{16} * 1024 * 1024;
    static constexpr std::size_t kMostSampledChannels = 16'384;
    /// What the descriptions of all files may take up in memory, between samplings too.
    static constexpr std::size_t kMostKeptBytes = std::size_t{16} * 1024 * 1024;

    explicit ChannelFolder(std::string path) : path_(std::move(path)) {}

    using Wanted = std::function<bool(const ChannelTable& table)>;

    /// Adds the files whose table is wanted to `samples`, by name. The system's error where the folder is there and
    /// cannot be read.
    std::optional<int> sample(const Wanted& wanted, Samples& samples);

    /// Why files gave nothing, for a person. Each reason of a file is told once, as long as it does not change.
    std::vector<std::string> takeFaults() { return std::exchange(faults_, {}); }

private:
    /// What is known of a file. Without a table it is refused as it stands, or there was no room for its table.
    struct Known {
        struct stat status {};
        ChannelFileHeader header;
        std::shared_ptr<const ChannelTable> table;
        std::size_t tableBytes = 0; ///< of the table, also of one that there was no room for
        std::string fault;          ///< as it was told
    };
    /// What one sampling may still spend.
    struct Budget {
        std::size_t bytes = kMostBytes;
        std::size_t channels = kMostSampledChannels;
    };

    bool listFiles(Samples& samples);
    bool sampleFile(const std::string& name, const Wanted& wanted, Budget& budget, Samples& samples);
    const Known* learn(const std::string& name, ByteSource& file, const struct stat& status, Budget& budget);
    void readTable(const std::string& name, ByteSource& file, Known& known);
    void refuse(const std::string& name, Known& known, const std::string& fault);
    /// In memory, for the tables of further files.
    std::size_t room() const;

    const std::string path_;
    FileDescriptor folder_; ///< during a sampling
    std::vector<std::string> names_;
    std::map<std::string, Known, std::less<>> known_;
    std::vector<std::string> faults_; ///< that nobody has taken yet
};

} // namespace vela::platform::hwstats
