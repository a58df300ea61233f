#include "platform/dbus/Names.h"

#include "common/values/Utf8.h"
#include "platform/dbus/Protocol.h"

#include <cstring>

namespace vela::platform::dbus {

namespace {

constexpr bool isLetter(char character) {
    const unsigned lower = static_cast<unsigned char>(character) | 0x20U;
    return lower - 'a' < 26 || character == '_';
}

constexpr bool isDigit(char character) { return character >= '0' && character <= '9'; }

/// Elements between dots, each not empty; at least two of them. `Begins` and `Continues` judge their characters.
template <class Begins, class Continues>
bool isDotted(std::string_view name, const Begins& begins, const Continues& continues) {
    bool first = true;
    bool dotted = false;
    for (const char character : name) {
        if (character == '.') {
            if (first) {
                return false;
            }
            first = true;
            dotted = true;
        } else if (first ? !begins(character) : !continues(character)) {
            return false;
        } else {
            first = false;
        }
    }
    return dotted && !first;
}

/// Takes complete types apart by the protocol's limits.
class SignatureScan {
public:
    explicit SignatureScan(std::string_view rest) : rest_(rest) {}

    bool complete() {
        const char code = take();
        if (isBasicType(code) || code == 'v') {
            return true;
        }
        return code == 'a' ? array() : code == '(' && structure();
    }
    bool atEnd() const { return rest_.empty(); }
    std::size_t left() const { return rest_.size(); }

private:
    static constexpr int kDeepest = 32;

    /// NUL, which is no type, at the end.
    char take() {
        if (rest_.empty()) {
            return '\0';
        }
        const char code = rest_.front();
        rest_.remove_prefix(1);
        return code;
    }
    bool array() {
        if (++arrays_ > kDeepest) {
            return false;
        }
        bool valid = false;
        if (!rest_.empty() && rest_.front() == '{') {
            take();
            valid = ++structures_ <= kDeepest && isBasicType(take()) && complete() && take() == '}';
            --structures_;
        } else {
            valid = complete();
        }
        --arrays_;
        return valid;
    }
    bool structure() {
        if (++structures_ > kDeepest) {
            return false;
        }
        bool valid = complete();
        while (valid && !rest_.empty() && rest_.front() != ')') {
            valid = complete();
        }
        --structures_;
        return valid && take() == ')';
    }

    std::string_view rest_;
    int arrays_ = 0;
    int structures_ = 0;
};

template <class Number>
Number numberAt(const char* bytes) {
    Number number = 0;
    std::memcpy(&number, bytes, sizeof(number));
    return number;
}

/// Whether all eight bytes are ASCII other than NUL.
bool isPlain(std::uint64_t eight) {
    constexpr std::uint64_t kOnes = 0x0101010101010101U;
    constexpr std::uint64_t kHighBits = 0x8080808080808080U;
    // A zero byte borrows, so its high bit shows up as well as that of a byte beyond ASCII.
    return ((eight | (eight - kOnes)) & kHighBits) == 0;
}

} // namespace

bool isValidText(std::string_view text) {
    const char* const bytes = text.data();
    const std::size_t size = text.size();
    bool plain = true;
    if (size >= sizeof(std::uint64_t)) {
        const std::size_t last = size - sizeof(std::uint64_t);
        for (std::size_t index = 0; index < last && plain; index += sizeof(std::uint64_t)) {
            plain = isPlain(numberAt<std::uint64_t>(bytes + index));
        }
        plain = plain && isPlain(numberAt<std::uint64_t>(bytes + last));
    } else if (size >= sizeof(std::uint32_t)) {
        const std::uint64_t first = numberAt<std::uint32_t>(bytes);
        plain = isPlain(first << 32U | numberAt<std::uint32_t>(bytes + size - sizeof(std::uint32_t)));
    } else {
        for (const char byte : text) {
            plain = plain && static_cast<signed char>(byte) > 0;
        }
    }
    return plain || (text.find('\0') == std::string_view::npos && isValidUtf8(text));
}

bool isValidObjectPath(std::string_view path) {
    if (path.empty() || path.front() != '/') {
        return false;
    }
    for (std::size_t index = 1; index < path.size(); ++index) {
        const char character = path[index];
        if (character == '/' ? path[index - 1] == '/' : !isLetter(character) && !isDigit(character)) {
            return false;
        }
    }
    return path.size() == 1 || path.back() != '/';
}

bool isValidInterfaceName(std::string_view name) {
    return name.size() <= kMaximumNameBytes &&
           isDotted(name, isLetter, [](char character) { return isLetter(character) || isDigit(character); });
}

bool isValidMemberName(std::string_view name) {
    if (name.empty() || name.size() > kMaximumNameBytes || !isLetter(name.front())) {
        return false;
    }
    for (const char character : name) {
        if (!isLetter(character) && !isDigit(character)) {
            return false;
        }
    }
    return true;
}

bool isValidBusName(std::string_view name) {
    if (name.empty() || name.size() > kMaximumNameBytes) {
        return false;
    }
    const auto continues = [](char character) { return isLetter(character) || isDigit(character) || character == '-'; };
    if (name.front() == ':') {
        // A bus's own names, which other implementations do not hold to a dot.
        for (std::size_t index = 1; index < name.size(); ++index) {
            const bool dot = name[index] == '.' && index + 1 < name.size() && continues(name[index + 1]);
            if (!dot && !continues(name[index])) {
                return false;
            }
        }
        return true;
    }
    return isDotted(
        name, [](char character) { return isLetter(character) || character == '-'; }, continues);
}

bool isValidSignature(std::string_view signature) {
    if (signature.size() > kMaximumSignatureBytes) {
        return false;
    }
    SignatureScan scan(signature);
    while (!scan.atEnd()) {
        if (!scan.complete()) {
            return false;
        }
    }
    return true;
}

std::size_t completeTypeBytes(std::string_view signature) {
    SignatureScan scan(signature);
    scan.complete();
    return signature.size() - scan.left();
}

std::size_t alignmentOf(char code) {
    switch (code) {
    case 'n':
    case 'q':
        return 2;
    case 'b':
    case 'i':
    case 'u':
    case 's':
    case 'o':
    case 'a':
    case 'h':
        return 4;
    case 'x':
    case 't':
    case 'd':
    case '(':
    case '{':
        return 8;
    default:
        return 1; // y, g, v
    }
}

std::string quoted(std::string_view text) {
    constexpr std::size_t kLongest = 64;
    std::string result = "\"";
    while (!text.empty() && result.size() <= kLongest) {
        const Utf8Step step = utf8Step(text);
        if (!step.valid) {
            result += "\xEF\xBF\xBD";
        } else if (step.codePoint < 0x20 || (step.codePoint >= 0x7F && step.codePoint < 0xA0)) {
            result += '?';
        } else {
            result += text.substr(0, step.bytes);
        }
        text.remove_prefix(step.bytes);
    }
    return result + (text.empty() ? "\"" : "...\"");
}

} // namespace vela::platform::dbus
