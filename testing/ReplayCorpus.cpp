// The main() of a fuzz target in ordinary builds: runs it once over every file named, or inside a folder named, as an
// argument.
#include <algorithm>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <sstream>
#include <string>
#include <system_error>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

namespace {

/// The regular files at or below `path`, in order; false when it cannot be read.
bool collect(const std::filesystem::path& path, std::vector<std::filesystem::path>& files) {
    std::error_code error;
    if (std::filesystem::is_regular_file(path, error)) {
        files.push_back(path);
        return true;
    }
    const std::size_t before = files.size();
    for (auto entry = std::filesystem::recursive_directory_iterator(path, error);
         !error && entry != std::filesystem::recursive_directory_iterator(); entry.increment(error)) {
        if (entry->is_regular_file(error)) {
            files.push_back(entry->path());
        }
    }
    std::sort(files.begin() + static_cast<std::ptrdiff_t>(before), files.end());
    if (error) {
        std::cerr << path.string() << ": " << error.message() << '\n';
    }
    return !error;
}

bool replay(const std::filesystem::path& file) {
    std::ifstream stream(file, std::ios::binary);
    std::ostringstream content;
    content << stream.rdbuf();
    if (!stream.is_open() || stream.bad()) {
        std::cerr << file.string() << ": cannot be read\n";
        return false;
    }
    // Named before it runs, so that the last line tells which one crashed.
    std::cout << file.string() << std::endl;
    // A copy of exactly this length lets the address sanitizer see a read behind its end.
    const std::string bytes = content.str();
    const std::vector<std::uint8_t> input(bytes.begin(), bytes.end());
    LLVMFuzzerTestOneInput(input.data(), input.size());
    return true;
}

} // namespace

int main(int argumentCount, char** arguments) {
    bool readable = true;
    std::vector<std::filesystem::path> files;
    for (int index = 1; index < argumentCount; ++index) {
        readable = collect(arguments[index], files) && readable;
    }
    for (const auto& file : files) {
        readable = replay(file) && readable;
    }
    std::cout << files.size() << " inputs run\n";
    return readable && !files.empty() ? 0 : 1;
}
