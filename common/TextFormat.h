// Texts made from printf-like format texts: "%25s:%-5d ", "com.orvex.vela.%@.%@".
//
// Conversions: %% %@ %s %d %i %u %x %X %f %g %c, with the flags "-" and "0", a width, a precision and the length words
// h hh l ll z q. Number and kind of the arguments are checked when the program is compiled. The argument's own type
// decides what is printed, never the length word: nothing is cut off, a boolean is 1 or 0, a negative number keeps its
// sign in every base. Decimal separator is "." whatever the locale. Pure functions; arguments are only borrowed.
#pragma once

#include "common/FormatConversion.h"
#include "common/values/Dictionary.h"
#include "common/values/Key.h"
#include "common/values/TextualForm.h"
#include "common/values/Value.h"

#include <array>
#include <concepts>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>

namespace vela {

/// A type of one's own is printable by "%@" when a function `appendDescription(std::string&, const Type&)` stands
/// beside it. It is called only when the text is really made.
template <class Type>
concept Describable = requires(std::string& text, const Type& object) {
    appendDescription(text, object);
};

namespace detail {

struct Description {
    const void* object;
    void (*append)(std::string& text, const void* object);
};

/// One argument without its type; std::monostate prints "(null)".
using FormatArgument =
    std::variant<std::monostate, char, std::int64_t, std::uint64_t, float, double, std::string_view, Description>;

/// How an argument of type `Type` is handed to the formatter. Undefined for what cannot be printed.
template <class Type>
struct ArgumentTraits;

template <>
struct ArgumentTraits<bool> {
    static constexpr ArgumentKind kKind = ArgumentKind::Integer;
    static FormatArgument make(bool boolean) { return std::int64_t{boolean ? 1 : 0}; }
};

template <ValueInteger Integer>
struct ArgumentTraits<Integer> {
    static constexpr ArgumentKind kKind = ArgumentKind::Integer;
    static FormatArgument make(Integer integer) {
        if constexpr (std::signed_integral<Integer>) {
            return static_cast<std::int64_t>(integer);
        } else {
            return static_cast<std::uint64_t>(integer);
        }
    }
};

template <class Enumeration>
requires(std::is_enum_v<Enumeration> && !Describable<Enumeration>) struct ArgumentTraits<Enumeration> {
    using Underlying = ArgumentTraits<std::underlying_type_t<Enumeration>>;
    static constexpr ArgumentKind kKind = Underlying::kKind;
    static FormatArgument make(Enumeration enumerator) {
        return Underlying::make(static_cast<std::underlying_type_t<Enumeration>>(enumerator));
    }
};

template <>
struct ArgumentTraits<char> {
    static constexpr ArgumentKind kKind = ArgumentKind::Character;
    static FormatArgument make(char character) { return character; }
};

template <class Real>
requires(std::same_as<Real, float> || std::same_as<Real, double>) struct ArgumentTraits<Real> {
    static constexpr ArgumentKind kKind = ArgumentKind::Real;
    static FormatArgument make(Real real) { return real; }
};

template <class Text>
requires std::is_convertible_v<const Text&, std::string_view>
struct ArgumentTraits<Text> {
    static constexpr ArgumentKind kKind = ArgumentKind::Text;
    static FormatArgument make(const Text& text) {
        if constexpr (std::is_pointer_v<Text>) {
            if (text == nullptr) {
                return std::monostate();
            }
        }
        return std::string_view(text);
    }
};

template <>
struct ArgumentTraits<std::nullptr_t> {
    static constexpr ArgumentKind kKind = ArgumentKind::Text;
    static FormatArgument make(std::nullptr_t) { return std::monostate(); }
};

template <>
struct ArgumentTraits<String> {
    static constexpr ArgumentKind kKind = ArgumentKind::Text;
    static FormatArgument make(const String& string) { return string.view(); }
};

template <>
struct ArgumentTraits<Key> {
    static constexpr ArgumentKind kKind = ArgumentKind::Text;
    static FormatArgument make(const Key& key) { return key.text(); }
};

template <class Type>
concept ValueLike = std::same_as<Type, ValueRef> || std::same_as<Type, Value> || std::same_as<Type, Array> ||
    std::same_as<Type, Dictionary> || std::same_as<Type, Data> || std::same_as<Type, Date>;

template <class Object>
requires(ValueLike<Object> || Describable<Object>) struct ArgumentTraits<Object> {
    static constexpr ArgumentKind kKind = ArgumentKind::Object;
    static FormatArgument make(const Object& object) { return Description{&object, &append}; }

    static void append(std::string& text, const void* untyped) {
        const Object& object = *static_cast<const Object*>(untyped);
        if constexpr (!ValueLike<Object>) {
            appendDescription(text, object);
        } else if constexpr (std::is_convertible_v<const Object&, ValueRef>) {
            appendTextualForm(text, object);
        } else {
            appendTextualForm(text, Value(object));
        }
    }
};

template <class Type>
struct ArgumentTraits<std::optional<Type>> {
    static constexpr ArgumentKind kKind = ArgumentTraits<Type>::kKind;
    static FormatArgument make(const std::optional<Type>& optional) {
        if (!optional) {
            return std::monostate();
        }
        return ArgumentTraits<Type>::make(*optional);
    }
};

/// "session/Session.cpp" is "Session".
constexpr std::string_view sourceNameOf(std::string_view file) {
    file.remove_prefix(file.find_last_of('/') + 1);
    return file.substr(0, file.find_last_of('.'));
}

enum class ArgumentBytes : std::uint8_t {
    AsTheyAre,
    Escaped, ///< by `appendEscaped`
};

void appendFormattedArguments(std::string& text, std::string_view format, std::span<const FormatArgument> arguments,
                              ArgumentBytes bytes);

} // namespace detail

/// A format text that fits arguments of the types `Types`, and where in the source it stands. Made by the compiler from
/// a literal; it keeps no arguments. Its members are scalars, so that an optimiser moves it behind a check of the log's
/// level.
template <class... Types>
class FormatText {
public:
    consteval FormatText(const char* format, const char* file = __builtin_FILE(), int lineInFile = __builtin_LINE())
        : text_(format),
          file_(file),
          line_(lineInFile) {
        const std::string_view name = detail::sourceNameOf(file);
        textLength_ = static_cast<std::uint32_t>(std::string_view(format).size());
        nameBegin_ = static_cast<std::uint32_t>(name.data() - file);
        nameLength_ = static_cast<std::uint32_t>(name.size());
        fileLength_ = static_cast<std::uint32_t>(std::string_view(file).size());
        detail::refuseUnlessItFits(detail::judgeFormat(format, {detail::ArgumentTraits<Types>::kKind...}));
    }

    constexpr std::string_view text() const { return {text_, textLength_}; }
    /// As the compiler was given it.
    constexpr std::string_view sourceFile() const { return {file_, fileLength_}; }
    /// The file's name without folder and extension.
    constexpr std::string_view sourceName() const { return {file_ + nameBegin_, nameLength_}; }
    constexpr int line() const { return line_; }

private:
    const char* text_;
    const char* file_;
    std::uint32_t textLength_;
    std::uint32_t fileLength_;
    std::uint32_t nameBegin_;
    std::uint32_t nameLength_;
    int line_;
};

template <class... Types>
void appendFormatted(std::string& text, const FormatText<std::type_identity_t<Types>...>& format,
                     const Types&... arguments) {
    const std::array<detail::FormatArgument, sizeof...(Types)> list{detail::ArgumentTraits<Types>::make(arguments)...};
    detail::appendFormattedArguments(text, format.text(), list, detail::ArgumentBytes::AsTheyAre);
}

template <class... Types>
std::string formatText(const FormatText<std::type_identity_t<Types>...>& format, const Types&... arguments) {
    std::string text;
    const std::array<detail::FormatArgument, sizeof...(Types)> list{detail::ArgumentTraits<Types>::make(arguments)...};
    detail::appendFormattedArguments(text, format.text(), list, detail::ArgumentBytes::AsTheyAre);
    return text;
}

/// Appends text from outside so that it can neither begin a line of its own nor hide or turn round what stands beside
/// it: control characters, line and paragraph separators, bidirectional controls and bytes that are not UTF-8 become
/// \n, \r, \t, \x1b, \u202e, \xff. A backslash stays as it is: what is shown is for reading, not for turning back.
void appendEscaped(std::string& text, std::string_view untrusted);

} // namespace vela
