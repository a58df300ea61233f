// velactl plist
#include "cli/Subcommand.h"
#include "common/CommandOptions.h"
#include "common/SettingValues.h"
#include "common/values/Json.h"
#include "platform/linux/LinuxFileSystem.h"
#include "platform/plist/PropertyListCodec.h"

#include <array>
#include <istream>
#include <optional>
#include <ostream>

namespace vela {

namespace {

using platform::PropertyListFormat;

constexpr std::array<CommandOption, 1> kOptions{{{"--to", true}}};

/// More than any preference file has; a person waits for the answer.
constexpr platform::PropertyListLimits kLimits{.bytes = std::size_t{64} * 1024 * 1024, .depth = 128, .values = 4000000};

struct Form {
    std::string_view name;
    std::optional<PropertyListFormat> format; ///< none for JSON
};
constexpr std::array<Form, 4> kForms{{{"json", std::nullopt},
                                      {"xml", PropertyListFormat::Xml},
                                      {"binary", PropertyListFormat::Binary},
                                      {"text", PropertyListFormat::Text}}};

const Form* findForm(std::string_view name) {
    for (const Form& form : kForms) {
        if (form.name == name) {
            return &form;
        }
    }
    return nullptr;
}

platform::Result<std::string> readStream(std::istream& in) {
    std::string bytes;
    std::array<char, 65536> block{};
    while (in.read(block.data(), block.size()) || in.gcount() > 0) {
        bytes.append(block.data(), static_cast<std::size_t>(in.gcount()));
        if (bytes.size() > kLimits.bytes) {
            return platform::Failure{0, "the input is larger than 64 MiB"};
        }
    }
    return bytes;
}

platform::Result<std::string> readInput(const std::string& file, std::istream& in) {
    if (file == "-") {
        return readStream(in);
    }
    const platform::LinuxFileSystem files;
    return files.readFile(file.starts_with('/') ? file : files.currentDirectory() + "/" + file, kLimits.bytes);
}

/// The property list in `bytes` in another form, ending in a line end unless it is binary.
platform::Result<std::string> convert(const std::string& bytes, const Form& form) {
    const platform::PropertyListCodec codec;
    const platform::Result<Value> value = codec.read(bytes, kLimits);
    if (!value) {
        return value.failure();
    }
    platform::Result<std::string> text =
        form.format ? codec.write(*value, *form.format) : jsonText(*value, JsonLayout::Pretty);
    if (!text || form.format == PropertyListFormat::Binary || text->ends_with('\n')) {
        return text;
    }
    return *text + "\n";
}

int fail(const std::string& file, const std::string& reason, Console& console) {
    console.error << "velactl: " << escapedText(file) << ": " << escapedText(reason) << '\n';
    return kFailed;
}

} // namespace

int runPlist(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> read = readArguments(arguments, kOptions);
    if (!read) {
        return refuseUsage("plist", read.failure().description, console);
    }
    if (read->operands.size() != 1) {
        return refuseUsage("plist", "it takes one file", console);
    }
    const std::vector<std::string> names = read->valuesOf("--to");
    const Form* form = names.empty() ? kForms.data() : findForm(names.back());
    if (form == nullptr) {
        return refuseUsage("plist", "there is no form " + quotedText(names.back()), console);
    }
    if (form->format == PropertyListFormat::Binary && console.terminal) {
        return refuseUsage("plist", "a binary property list is not for a terminal: redirect it", console);
    }
    const std::string& file = read->operands.front();
    const platform::Result<std::string> bytes = readInput(file, console.in);
    if (!bytes) {
        return fail(file, bytes.failure().description, console);
    }
    const platform::Result<std::string> converted = convert(*bytes, *form);
    if (!converted) {
        return fail(file, converted.failure().description, console);
    }
    console.out << *converted;
    return kDone;
}

} // namespace vela
