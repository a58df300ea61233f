#include "platform/toml/TomlBounds.h"

#include <algorithm>
#include <cstddef>

namespace vela::platform {

namespace {

constexpr int kDotsInLine = 16;
constexpr int kLines = 20000;
constexpr std::string_view kByteOrderMark = "\xef\xbb\xbf";

/// Walks over TOML text by its rules for comments and texts. After the first fault of what is no TOML it may take text
/// for something else or the other way round; the parser stops at that fault. A quotation mark inside a word is refused
/// because the parser reads on to the word's end before it finds that fault.
class Scanner {
public:
    explicit Scanner(std::string_view text) : text_(text) {
        if (text_.starts_with(kByteOrderMark)) {
            text_.remove_prefix(kByteOrderMark.size());
        }
    }

    std::optional<TomlRefusal> scan() {
        while (at_ < text_.size() && reason_.empty()) {
            step();
        }
        return reason_.empty() ? std::nullopt : std::optional(TomlRefusal{line_, std::move(reason_)});
    }

private:
    void step() {
        const char letter = text_[at_];
        if (letter == '#') {
            at_ = std::min(text_.find('\n', at_), text_.size());
        } else if (letter == '"' || letter == '\'') {
            skipText(letter);
        } else {
            ++at_;
            takeLetter(letter);
        }
    }

    void takeLetter(char letter) {
        if (letter == '\n') {
            dots_ = 0;
            if (++line_ > kLines) {
                reason_ = "more than " + std::to_string(kLines) + " lines";
            }
        } else if (letter == '.' && ++dots_ > kDotsInLine) {
            reason_ = "more than " + std::to_string(kDotsInLine) + " dots in one line";
        } else if (static_cast<unsigned char>(letter) >= 0x80) {
            reason_ = "a character beyond ASCII outside quotation marks";
        }
    }

    /// Goes behind the text that begins here; to the line's end when it has no end, for the parser to refuse.
    void skipText(char mark) {
        constexpr std::string_view kBeforeText = " \t\n=,.[{";
        if (at_ > 0 && kBeforeText.find(text_[at_ - 1]) == std::string_view::npos) {
            reason_ = "a quotation mark inside a word";
            return;
        }
        if (text_.substr(at_, 3) == std::string(3, mark)) {
            reason_ = "a text over several lines";
            return;
        }
        for (++at_; at_ < text_.size() && text_[at_] != '\n'; ++at_) {
            if (text_[at_] == mark) {
                ++at_;
                return;
            }
            const bool escape = mark == '"' && text_[at_] == '\\';
            at_ += escape && at_ + 1 < text_.size() && text_[at_ + 1] != '\n' ? 1U : 0U;
        }
    }

    std::string_view text_;
    std::size_t at_ = 0;
    int line_ = 1;
    int dots_ = 0;
    std::string reason_;
};

} // namespace

std::optional<TomlRefusal> findTomlRefusal(std::string_view text) { return Scanner(text).scan(); }

} // namespace vela::platform
