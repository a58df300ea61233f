// The same over sd-bus, peer to peer: the service's own method signature, decoded into a map and answered.
#include "benchmarks/ipc/BenchMessage.h"
#include "benchmarks/ipc/Subject.h"
#include "platform/linux/FileDescriptor.h"

#include <cerrno>
#include <sys/socket.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-event.h>

namespace vela::ipcbench {

namespace {

constexpr const char* kPath = "/com/orvex/vela/benchmark";
constexpr const char* kInterface = "com.orvex.vela.Benchmark";
constexpr const char* kMember = "sendMessage";

/// As `require`, for calls that answer a negative error.
int requireBus(int answer, const char* what) {
    errno = answer < 0 ? -answer : 0;
    require(answer >= 0, what);
    return answer;
}

PlainValue readVariant(sd_bus_message* message) {
    char type = 0;
    const char* contents = nullptr;
    requireBus(sd_bus_message_peek_type(message, &type, &contents), "sd-bus: type");
    requireBus(sd_bus_message_enter_container(message, SD_BUS_TYPE_VARIANT, contents), "sd-bus: variant");
    PlainValue value;
    switch (contents[0]) {
    case SD_BUS_TYPE_BOOLEAN: {
        int boolean = 0;
        requireBus(sd_bus_message_read_basic(message, SD_BUS_TYPE_BOOLEAN, &boolean), "sd-bus: boolean");
        value = boolean != 0;
        break;
    }
    case SD_BUS_TYPE_INT64: {
        std::int64_t integer = 0;
        requireBus(sd_bus_message_read_basic(message, SD_BUS_TYPE_INT64, &integer), "sd-bus: integer");
        value = integer;
        break;
    }
    case SD_BUS_TYPE_DOUBLE: {
        double real = 0;
        requireBus(sd_bus_message_read_basic(message, SD_BUS_TYPE_DOUBLE, &real), "sd-bus: real");
        value = real;
        break;
    }
    default: {
        const char* text = nullptr;
        requireBus(sd_bus_message_read_basic(message, SD_BUS_TYPE_STRING, &text), "sd-bus: text");
        value = std::string(text);
        break;
    }
    }
    requireBus(sd_bus_message_exit_container(message), "sd-bus: variant's end");
    return value;
}

PlainMap readMessage(sd_bus_message* message) {
    PlainMap map;
    requireBus(sd_bus_message_enter_container(message, SD_BUS_TYPE_ARRAY, "{sv}"), "sd-bus: dictionary");
    while (requireBus(sd_bus_message_enter_container(message, SD_BUS_TYPE_DICT_ENTRY, "sv"), "sd-bus: entry") > 0) {
        const char* key = nullptr;
        requireBus(sd_bus_message_read_basic(message, SD_BUS_TYPE_STRING, &key), "sd-bus: key");
        map.emplace(key, readVariant(message));
        requireBus(sd_bus_message_exit_container(message), "sd-bus: entry's end");
    }
    requireBus(sd_bus_message_exit_container(message), "sd-bus: dictionary's end");
    return map;
}

int handleMessage(sd_bus_message* message, void*, sd_bus_error*) {
    const PlainMap map = readMessage(message);
    require(isWhole(map), "a message is not what was sent");
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    requireBus(sd_bus_message_read(message, "uq", &category, &type), "sd-bus: category and type");
    requireBus(sd_bus_message_enter_container(message, SD_BUS_TYPE_ARRAY, "ax"), "sd-bus: lists");
    const void* ids = nullptr;
    std::size_t bytes = 0;
    requireBus(sd_bus_message_read_array(message, SD_BUS_TYPE_INT64, &ids, &bytes), "sd-bus: list");
    return sd_bus_reply_method_return(message, "");
}

// The library's macros are C.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wpedantic"
#pragma GCC diagnostic ignored "-Wold-style-cast"
#pragma GCC diagnostic ignored "-Wmissing-field-initializers"
const sd_bus_vtable kObject[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD(kMember, "a{sv}uqaax", "", handleMessage, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
};
#pragma GCC diagnostic pop

sd_bus* acceptClient(int listener) {
    const int socket = accept4(listener, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
    require(socket >= 0, "accept");
    sd_bus* bus = nullptr;
    sd_id128_t identifier;
    requireBus(sd_id128_randomize(&identifier), "sd-bus: identifier");
    requireBus(sd_bus_new(&bus), "sd-bus: server");
    requireBus(sd_bus_set_fd(bus, socket, socket), "sd-bus: descriptor");
    requireBus(sd_bus_set_server(bus, 1, identifier), "sd-bus: serving");
    requireBus(sd_bus_set_trusted(bus, 1), "sd-bus: trust");
    requireBus(sd_bus_add_object_vtable(bus, nullptr, kPath, kInterface, kObject, nullptr), "sd-bus: object");
    requireBus(sd_bus_start(bus), "sd-bus: start");
    return bus;
}

void serve(int listener, unsigned clients) {
    if (clients == 1) { // without an event loop it is quickest
        sd_bus* bus = acceptClient(listener);
        for (int worked = 0; worked >= 0;) {
            worked = sd_bus_process(bus, nullptr);
            if (worked == 0) {
                sd_bus_wait(bus, UINT64_MAX);
            }
        }
        return;
    }
    sd_event* loop = nullptr;
    requireBus(sd_event_new(&loop), "sd-bus: event loop");
    for (unsigned client = 0; client < clients; ++client) {
        requireBus(sd_bus_attach_event(acceptClient(listener), loop, SD_EVENT_PRIORITY_NORMAL), "sd-bus: attach");
    }
    sd_event_loop(loop);
}

class SdBusChannel final : public Channel {
public:
    explicit SdBusChannel(const std::string& path) {
        requireBus(sd_bus_new(&bus_), "sd-bus: client");
        const std::string address = "unix:path=" + path;
        requireBus(sd_bus_set_address(bus_, address.c_str()), "sd-bus: address");
        requireBus(sd_bus_start(bus_), "sd-bus: connect");
    }
    SdBusChannel(const SdBusChannel&) = delete;
    SdBusChannel& operator=(const SdBusChannel&) = delete;
    ~SdBusChannel() override { sd_bus_close_unref(bus_); }

    void post(std::int64_t number, bool reply) override {
        sd_bus_message* message = makeCall(number);
        if (reply) {
            requireBus(sd_bus_call_async(bus_, nullptr, message, countReply, this, 0), "sd-bus: call");
        } else {
            requireBus(sd_bus_message_set_expect_reply(message, 0), "sd-bus: no reply");
            requireBus(sd_bus_send(bus_, message, nullptr), "sd-bus: send");
            requireBus(sd_bus_flush(bus_), "sd-bus: flush"); // as the others, it waits for a socket that is full
        }
        sd_bus_message_unref(message);
    }
    void takeReply() override {
        while (replies_ == 0) {
            if (requireBus(sd_bus_process(bus_, nullptr), "sd-bus: process") == 0) {
                requireBus(sd_bus_wait(bus_, UINT64_MAX), "sd-bus: wait");
            }
        }
        --replies_;
    }
    void call(std::int64_t number) override {
        sd_bus_message* message = makeCall(number);
        sd_bus_message* reply = nullptr;
        requireBus(sd_bus_call(bus_, message, 0, nullptr, &reply), "sd-bus: call");
        sd_bus_message_unref(reply);
        sd_bus_message_unref(message);
    }

private:
    static int countReply(sd_bus_message* reply, void* channel, sd_bus_error*) {
        require(sd_bus_message_is_method_error(reply, nullptr) == 0, "sd-bus: an error came back");
        ++static_cast<SdBusChannel*>(channel)->replies_;
        return 1;
    }
    static void append(sd_bus_message* message, const char* key, const char* type, const void* value) {
        requireBus(sd_bus_message_open_container(message, SD_BUS_TYPE_DICT_ENTRY, "sv"), "sd-bus: entry");
        requireBus(sd_bus_message_append_basic(message, SD_BUS_TYPE_STRING, key), "sd-bus: key");
        requireBus(sd_bus_message_open_container(message, SD_BUS_TYPE_VARIANT, type), "sd-bus: variant");
        requireBus(sd_bus_message_append_basic(message, type[0], value), "sd-bus: value");
        requireBus(sd_bus_message_close_container(message), "sd-bus: variant");
        requireBus(sd_bus_message_close_container(message), "sd-bus: entry");
    }
    static void append(sd_bus_message* message, const char* key, bool value) {
        const int boolean = value ? 1 : 0;
        append(message, key, "b", &boolean);
    }
    static void append(sd_bus_message* message, const char* key, std::int64_t value) {
        append(message, key, "x", &value);
    }
    static void append(sd_bus_message* message, const char* key, double value) { append(message, key, "d", &value); }
    static void append(sd_bus_message* message, const char* key, std::string_view value) {
        append(message, key, "s", value.data());
    }
    sd_bus_message* makeCall(std::int64_t number) {
        sd_bus_message* message = nullptr;
        requireBus(sd_bus_message_new_method_call(bus_, &message, nullptr, kPath, kInterface, kMember), "sd-bus: new");
        requireBus(sd_bus_message_open_container(message, SD_BUS_TYPE_ARRAY, "{sv}"), "sd-bus: dictionary");
        forEachEntry(number, [message](const char* key, auto value) { append(message, key, value); });
        requireBus(sd_bus_message_close_container(message), "sd-bus: dictionary");
        requireBus(sd_bus_message_append(message, "uqaax", kCategory, kType, 1, 1, std::int64_t{1}), "sd-bus: rest");
        return message;
    }

    sd_bus* bus_ = nullptr;
    std::uint64_t replies_ = 0;
};

} // namespace

Subject sdBusSubject() {
    return {"(b) sd-bus", [](unsigned clients) {
                const std::string path = socketPath("sdbus");
                auto running = std::make_unique<ForkedServer>(path, SOCK_STREAM, clients, serve);
                running->connect(clients, [&path] { return std::make_unique<SdBusChannel>(path); });
                return running;
            }};
}

} // namespace vela::ipcbench
