// Our codec against libdbus, both ways: what libdbus takes for a message we take for one too, and read the same values
// of its arguments from it; what we take, and what we write, libdbus takes and reads the same values from.
#include "platform/dbus/MessageReader.h"
#include "platform/dbus/MessageWriter.h"

#include <bit>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <dbus/dbus.h>
#include <memory>

namespace {

using namespace vela;
using namespace vela::platform::dbus;

void require(bool condition, const char* what) {
    if (!condition) {
        std::fputs(what, stderr);
        std::abort();
    }
}

struct Unreference {
    void operator()(DBusMessage* message) const { dbus_message_unref(message); }
};
using LibdbusMessage = std::unique_ptr<DBusMessage, Unreference>;

LibdbusMessage demarshal(std::string_view bytes) {
    DBusError error;
    dbus_error_init(&error);
    LibdbusMessage message(dbus_message_demarshal(bytes.data(), static_cast<int>(bytes.size()), &error));
    dbus_error_free(&error);
    return message;
}

/// A value as a text that tells kinds, widths and bits apart, made from what libdbus reads.
class Spelling {
public:
    /// False when it is of a type that no property-list value has.
    bool variant(DBusMessageIter& at) {
        DBusMessageIter inner;
        dbus_message_iter_recurse(&at, &inner);
        return value(inner, false);
    }
    bool dictionary(DBusMessageIter& at) {
        // As a dictionary's entries: a key that comes again keeps its place and takes the last value.
        DictionaryBuilder builder;
        DBusMessageIter entries;
        dbus_message_iter_recurse(&at, &entries);
        for (; dbus_message_iter_get_arg_type(&entries) == DBUS_TYPE_DICT_ENTRY; dbus_message_iter_next(&entries)) {
            DBusMessageIter entry;
            dbus_message_iter_recurse(&entries, &entry);
            const char* key = nullptr;
            dbus_message_iter_get_basic(&entry, &key);
            dbus_message_iter_next(&entry);
            if (!variant(entry)) {
                return false;
            }
            builder.add(std::string_view(key), std::move(result));
        }
        result = builder.build();
        return true;
    }

    Value result;

private:
    template <class Type>
    static Type basic(DBusMessageIter& at) {
        Type content{};
        dbus_message_iter_get_basic(&at, &content);
        return content;
    }

    bool value(DBusMessageIter& at, bool inArray) {
        switch (dbus_message_iter_get_arg_type(&at)) {
        case DBUS_TYPE_BOOLEAN:
            return result = basic<dbus_bool_t>(at) != 0, true;
        case DBUS_TYPE_BYTE:
            return result = basic<unsigned char>(at), true;
        case DBUS_TYPE_INT16:
            return result = basic<dbus_int16_t>(at), true;
        case DBUS_TYPE_UINT16:
            return result = basic<dbus_uint16_t>(at), true;
        case DBUS_TYPE_INT32:
            return result = basic<dbus_int32_t>(at), true;
        case DBUS_TYPE_UINT32:
            return result = basic<dbus_uint32_t>(at), true;
        case DBUS_TYPE_INT64:
            return result = static_cast<std::int64_t>(basic<dbus_int64_t>(at)), true;
        case DBUS_TYPE_UINT64:
            return result = static_cast<std::uint64_t>(basic<dbus_uint64_t>(at)), true;
        case DBUS_TYPE_DOUBLE:
            return result = basic<double>(at), true;
        case DBUS_TYPE_STRING:
        case DBUS_TYPE_OBJECT_PATH:
        case DBUS_TYPE_SIGNATURE:
            return result = basic<const char*>(at), true;
        case DBUS_TYPE_VARIANT:
            return inArray && variant(at);
        case DBUS_TYPE_ARRAY:
            return array(at);
        case DBUS_TYPE_STRUCT:
            return date(at);
        default:
            return false;
        }
    }

    bool date(DBusMessageIter& at) {
        DBusMessageIter inner;
        dbus_message_iter_recurse(&at, &inner);
        if (dbus_message_iter_get_arg_type(&inner) != DBUS_TYPE_STRING) {
            return false;
        }
        const std::string_view text = basic<const char*>(inner);
        if (!dbus_message_iter_next(&inner) || dbus_message_iter_get_arg_type(&inner) != DBUS_TYPE_DOUBLE ||
            text != "date") {
            return false;
        }
        const auto seconds = basic<double>(inner);
        return result = Date{seconds}, !dbus_message_iter_next(&inner);
    }

    bool array(DBusMessageIter& at) {
        char* signature = dbus_message_iter_get_signature(&at);
        const std::string type(signature);
        dbus_free(signature);
        if (type == "a{sv}") {
            return dictionary(at);
        }
        DBusMessageIter elements;
        dbus_message_iter_recurse(&at, &elements);
        if (type == "ay") {
            const char* bytes = nullptr;
            int count = 0;
            dbus_message_iter_get_fixed_array(&elements, &bytes, &count);
            return result = Data(std::string_view(bytes, static_cast<std::size_t>(count))), true;
        }
        const std::size_t core = type.find_first_not_of('a');
        if (std::string_view("ybnqiuxtdsogv").find(type[core]) == std::string_view::npos &&
            type.substr(core) != "(sd)" && type.substr(core) != "{sv}") {
            return false;
        }
        ArrayBuilder builder;
        for (; dbus_message_iter_get_arg_type(&elements) != DBUS_TYPE_INVALID; dbus_message_iter_next(&elements)) {
            if (!value(elements, true)) {
                return false;
            }
            builder.add(std::move(result));
        }
        return result = builder.build(), true;
    }
};

/// The bytes of `dictionary` as we write it: equal for equal values, whatever reals that are not numbers say.
std::string written(const Dictionary& dictionary) {
    std::string bytes;
    MessageWriter writer(bytes);
    writer.beginCall({.serial = 1, .path = "/", .member = "m", .signature = "a{sv}"});
    writer.dictionary(dictionary);
    require(writer.finish(), "a dictionary cannot be written");
    return bytes;
}

/// The first argument of a message, as libdbus reads it; none when no property list has it.
bool firstDictionary(DBusMessage& message, Dictionary& dictionary) {
    DBusMessageIter at;
    Spelling spelling;
    if (dbus_message_iter_init(&message, &at) == FALSE || !spelling.dictionary(at)) {
        return false;
    }
    dictionary = spelling.result.ref().dictionary();
    return true;
}

void compareHeader(const MessageHeader& ours, DBusMessage& theirs) {
    const auto same = [](std::string_view text, const char* other) { return text == (other == nullptr ? "" : other); };
    require(static_cast<int>(ours.type) == dbus_message_get_type(&theirs), "type");
    require(ours.serial == dbus_message_get_serial(&theirs), "serial");
    require(ours.replySerial == dbus_message_get_reply_serial(&theirs), "reply serial");
    require(same(ours.path, dbus_message_get_path(&theirs)), "path");
    require(same(ours.interface, dbus_message_get_interface(&theirs)), "interface");
    require(same(ours.member, dbus_message_get_member(&theirs)), "member");
    require(same(ours.errorName, dbus_message_get_error_name(&theirs)), "error name");
    require(same(ours.destination, dbus_message_get_destination(&theirs)), "destination");
    require(same(ours.sender, dbus_message_get_sender(&theirs)), "sender");
    require(same(ours.signature, dbus_message_get_signature(&theirs)), "signature");
}

void compareWritten(const Dictionary& dictionary) {
    const std::string bytes = written(dictionary);
    const LibdbusMessage message = demarshal(bytes);
    // libdbus counts nesting differently, and takes at most 64 containers.
    if (message == nullptr) {
        return;
    }
    Dictionary theirs;
    require(firstDictionary(*message, theirs) && written(theirs) == bytes, "libdbus reads something else");
}

void compare(std::string_view bytes) {
    MessageHeader header;
    auto error = header.read(bytes);
    const LibdbusMessage theirs = demarshal(bytes);
    Dictionary ours;
    const bool dictionary = !error && header.signature.substr(0, 5) == "a{sv}";
    if (!error) {
        BodyReader reader(header, 200);
        if (dictionary) {
            ours = reader.dictionary();
        }
        if (header.signature == "a{sv}") {
            reader.finish();
        }
        error = reader.error();
    }
    if (theirs == nullptr) {
        return;
    }
    require(!error || error->name == kInvalidArgsError, "libdbus takes what we do not");
    compareHeader(header, *theirs);
    if (dictionary) {
        Dictionary expected;
        const bool readable = firstDictionary(*theirs, expected);
        require(readable == !error, "we and libdbus disagree about the types of values");
        if (readable) {
            require(written(ours) == written(expected), "we read other values than libdbus");
            compareWritten(ours);
        }
    }
}

/// Whether libdbus refuses what we take whole, although nothing in it is of the kinds that we read more freely.
void compareOtherWay(std::string_view bytes) {
    MessageHeader header;
    if (header.read(bytes) || header.signature != "a{sv}") {
        return;
    }
    BodyReader reader(header, 8);
    reader.dictionary();
    reader.finish();
    require(reader.error() || demarshal(bytes) != nullptr, "we take what libdbus does not");
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    std::string_view rest(reinterpret_cast<const char*>(data), size);
    const Frame frame = frameOf(rest);
    // A length that both sides agree on lets the rest be looked at.
    if (frame.state == Frame::State::Known && frame.bytes <= rest.size()) {
        rest = rest.substr(0, frame.bytes);
        compareOtherWay(rest);
    }
    compare(rest);
    return 0;
}
