// The least that could do the job: a process that takes JSON texts from a socket and inserts them into SQLite.
//
//     | length u32, this machine's order | JSON text |     a length of 0 asks for a commit, answered with one byte
#include "benchmarks/delivery/Peer.h"
#include "benchmarks/ipc/BenchMessage.h"
#include "testing/TemporaryFolder.h"

#include <charconv>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <sqlite3.h>
#include <sys/socket.h>
#include <unistd.h>

namespace vela::deliverybench {

namespace {

constexpr int kGroup = 64;

class Writer {
public:
    explicit Writer(const std::string& file) {
        good(sqlite3_open(file.c_str(), &database_));
        execute("PRAGMA journal_mode = WAL");
        execute("PRAGMA synchronous = FULL");
        execute("CREATE TABLE message(seq INTEGER PRIMARY KEY, payload TEXT NOT NULL)");
        good(sqlite3_prepare_v2(database_, "INSERT INTO message(payload) VALUES(?1)", -1, &insert_, nullptr));
        good(sqlite3_prepare_v2(database_, "BEGIN", -1, &begin_, nullptr));
        good(sqlite3_prepare_v2(database_, "COMMIT", -1, &commit_, nullptr));
    }

    void add(std::string_view text) {
        if (group_ == 0) {
            run(begin_);
        }
        good(sqlite3_bind_text(insert_, 1, text.data(), static_cast<int>(text.size()), SQLITE_STATIC));
        run(insert_);
        if (++group_ == kGroup) {
            commit();
        }
    }
    void commit() {
        if (group_ > 0) {
            run(commit_);
            group_ = 0;
        }
    }

private:
    static void good(int code) { require(code == SQLITE_OK, "writer: SQLite"); }
    void execute(const char* sql) { good(sqlite3_exec(database_, sql, nullptr, nullptr, nullptr)); }
    static void run(sqlite3_stmt* statement) {
        require(sqlite3_step(statement) == SQLITE_DONE, "writer: SQLite");
        good(sqlite3_reset(statement));
    }

    // Open until the process is killed.
    sqlite3* database_ = nullptr;
    sqlite3_stmt* insert_ = nullptr;
    sqlite3_stmt* begin_ = nullptr;
    sqlite3_stmt* commit_ = nullptr;
    int group_ = 0;
};

/// Handles the whole texts in `bytes` and answers how many bytes they were.
std::size_t takeTexts(int socket, Writer& writer, std::string_view bytes) {
    std::size_t at = 0;
    std::uint32_t length = 0;
    while (bytes.size() - at >= sizeof(length)) {
        std::memcpy(&length, bytes.data() + at, sizeof(length));
        if (bytes.size() - at - sizeof(length) < length) {
            break;
        }
        if (length == 0) {
            writer.commit();
            sendWhole(socket, "k");
        } else {
            writer.add(bytes.substr(at + sizeof(length), length));
        }
        at += sizeof(length) + length;
    }
    return at;
}

void serve(int listener, const std::string& file) {
    Writer writer(file);
    const int socket = accept(listener, nullptr, nullptr);
    require(socket >= 0, "writer: accept");
    std::string bytes(std::size_t{64} * 1024, '\0');
    std::size_t filled = 0;
    for (;;) {
        const ssize_t got = recv(socket, bytes.data() + filled, bytes.size() - filled, 0);
        if (got <= 0) {
            return;
        }
        filled += static_cast<std::size_t>(got);
        const std::size_t taken = takeTexts(socket, writer, std::string_view(bytes).substr(0, filled));
        filled -= taken;
        std::memmove(bytes.data(), bytes.data() + taken, filled);
    }
}

void appendValue(std::string& text, bool value) { text += value ? "true" : "false"; }
void appendValue(std::string& text, std::string_view value) { text.append("\"").append(value).append("\""); }
template <class Number>
void appendValue(std::string& text, Number value) {
    char digits[32];
    text.append(digits, std::to_chars(digits, std::end(digits), value).ptr);
}

/// No text here needs an escape.
void appendFrame(std::string& bytes, std::int64_t number) {
    std::uint32_t length = 0;
    bytes.append(sizeof(length), '\0');
    const std::size_t begin = bytes.size();
    ipcbench::forEachEntry(number, [&](std::string_view key, auto value) {
        bytes.append(bytes.size() == begin ? "{\"" : ",\"").append(key).append("\":");
        appendValue(bytes, value);
    });
    bytes += '}';
    length = static_cast<std::uint32_t>(bytes.size() - begin);
    std::memcpy(bytes.data() + begin - sizeof(length), &length, sizeof(length));
}

Cost measure(std::size_t messages) {
    const testing::TemporaryFolder folder;
    const std::string file = folder / "messages.db";
    ipcbench::ForkedServer server(folder / "socket", SOCK_STREAM, 1,
                                  [&file](int listener, unsigned) { serve(listener, file); });
    const int socket = ipcbench::connectedSocket(folder / "socket", SOCK_STREAM);
    Watch watch(server.process());
    std::string bytes;
    for (std::size_t number = 0; number < messages; ++number) {
        bytes.clear();
        appendFrame(bytes, static_cast<std::int64_t>(number));
        sendWhole(socket, bytes);
    }
    sendWhole(socket, std::string_view("\0\0\0\0", 4));
    char answer = 0;
    require(recv(socket, &answer, 1, 0) == 1, "writer: the answer");
    watch.kept();
    Cost cost = watch.costOf(messages);
    cost.bytes = static_cast<double>(sizeOfDatabase(file)) / static_cast<double>(messages);
    close(socket);
    return cost;
}

} // namespace

Peer writerPeer() { return {"bare writer", "committed, synchronous=FULL", "", measure}; }

} // namespace vela::deliverybench
