// The protocol. A datagram holds fields, one after another, in one of two forms:
//
//     NAME=value\n                                    a value without a line end
//     NAME\n | length, u64 little-endian | value\n    any value
//
// Fields that do not fit into a datagram go into a sealed memory file, whose descriptor travels in an empty datagram.
#include "platform/journal/JournalLog.h"

#include <array>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <fcntl.h>
#include <iterator>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <system_error>
#include <unistd.h>

namespace vela::platform {

namespace {

/// The journal's numbers are those of syslog.
std::string_view priorityOf(LogLevel level) {
    switch (level) {
    case LogLevel::Debug:
        return "7";
    case LogLevel::Info:
        return "6";
    case LogLevel::Default:
        return "5";
    case LogLevel::Error:
        return "3";
    }
    return "5";
}

void appendField(std::string& fields, std::string_view name, std::string_view value) {
    fields += name;
    if (value.find('\n') == std::string_view::npos) {
        fields += '=';
    } else {
        fields += '\n';
        for (unsigned shift = 0; shift < 64; shift += 8) {
            fields += static_cast<char>(static_cast<unsigned char>(std::uint64_t{value.size()} >> shift));
        }
    }
    fields += value;
    fields += '\n';
}

void appendField(std::string& fields, std::string_view name, std::int64_t number) {
    char digits[20];
    const char* const end = std::to_chars(digits, std::end(digits), number).ptr;
    appendField(fields, name, std::string_view(digits, end));
}

std::string fieldsOf(const LogRecord& record, std::string_view identifier) {
    std::string fields;
    fields.reserve(record.text.size() + 256);
    appendField(fields, "MESSAGE", record.text);
    appendField(fields, "PRIORITY", priorityOf(record.level));
    appendField(fields, "SYSLOG_IDENTIFIER", identifier);
    appendField(fields, "SUBSYSTEM", record.subsystem);
    appendField(fields, "CATEGORY", record.category);
    appendField(fields, "SOURCE_NAME", record.sourceName);
    appendField(fields, "CODE_FILE", record.sourceFile);
    appendField(fields, "CODE_LINE", record.line);
    if (record.reporter) {
        appendField(fields, "VELA_REPORTER_ID", *record.reporter);
    }
    return fields;
}

sockaddr_un addressOf(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.data(), path.size());
    return address;
}

/// Sends `message` to the socket at `path`; answers whether it went, errno saying why not.
bool sendTo(int socket, const std::string& path, msghdr message) {
    sockaddr_un address = addressOf(path);
    message.msg_name = &address;
    message.msg_namelen = sizeof(address);
    ssize_t sent = 0;
    do {
        sent = sendmsg(socket, &message, MSG_NOSIGNAL);
    } while (sent < 0 && errno == EINTR);
    return sent >= 0;
}

bool writeWhole(int file, std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t written = ::write(file, bytes.data(), bytes.size());
        if (written < 0 && errno != EINTR) {
            return false;
        }
        bytes.remove_prefix(written < 0 ? 0 : static_cast<std::size_t>(written));
    }
    return true;
}

Failure failureOf(const std::string& path, int code) {
    return {code, "journal socket " + path + ": " + std::generic_category().message(code)};
}

} // namespace

Result<std::unique_ptr<JournalLog>> JournalLog::open(std::string identifier, std::string socketPath) {
    if (socketPath.size() >= sizeof(sockaddr_un::sun_path)) {
        return failureOf(socketPath, ENAMETOOLONG);
    }
    struct stat status {};
    if (stat(socketPath.c_str(), &status) != 0) {
        return failureOf(socketPath, errno);
    }
    if (!S_ISSOCK(status.st_mode)) {
        return failureOf(socketPath, ENOTSOCK);
    }
    const int socket = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (socket < 0) {
        return failureOf(socketPath, errno);
    }
    return std::unique_ptr<JournalLog>(new JournalLog(std::move(identifier), std::move(socketPath), socket));
}

JournalLog::~JournalLog() { close(socket_); }

void JournalLog::write(const LogRecord& record) {
    if (!send(fieldsOf(record, identifier_))) {
        lost_.fetch_add(1, std::memory_order_relaxed);
    }
}

bool JournalLog::send(std::string_view fields) const {
    iovec part{const_cast<char*>(fields.data()), fields.size()};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    if (sendTo(socket_, socketPath_, message)) {
        return true;
    }
    return (errno == EMSGSIZE || errno == ENOBUFS) && sendAsFile(fields);
}

bool JournalLog::sendAsFile(std::string_view fields) const {
    const int file = memfd_create("vela-log-line", MFD_CLOEXEC | MFD_ALLOW_SEALING);
    if (file < 0) {
        return false;
    }
    // The journal takes only what can no longer change.
    constexpr int kSeals = F_SEAL_SEAL | F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_WRITE;
    bool sent = writeWhole(file, fields) && fcntl(file, F_ADD_SEALS, kSeals) == 0;
    if (sent) {
        alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
        msghdr message{};
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        cmsghdr* const header = CMSG_FIRSTHDR(&message);
        header->cmsg_level = SOL_SOCKET;
        header->cmsg_type = SCM_RIGHTS;
        header->cmsg_len = CMSG_LEN(sizeof(int));
        std::memcpy(CMSG_DATA(header), &file, sizeof(file));
        sent = sendTo(socket_, socketPath_, message);
    }
    close(file);
    return sent;
}

} // namespace vela::platform
