#include "platform/journal/JournalLog.h"
#include "testing/TemporaryFolder.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <thread>
#include <unistd.h>
#include <utility>
#include <vector>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;
using ::testing::Pair;

using Fields = std::vector<std::pair<std::string, std::string>>;

struct Datagram {
    std::string bytes;
    int file = -1; ///< owned by the receiver
};

/// The journal's end of the protocol.
class Journal {
public:
    explicit Journal(const std::string& path)
        : socket_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path.copy(address.sun_path, sizeof(address.sun_path) - 1);
        EXPECT_EQ(bind(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
    }
    ~Journal() { close(socket_); }
    Journal(const Journal&) = delete;
    Journal& operator=(const Journal&) = delete;

    /// The next datagram, or none: datagrams have arrived when their sending is over.
    std::optional<Datagram> receive() const {
        std::vector<char> buffer(256 * 1024);
        iovec part{buffer.data(), buffer.size()};
        alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
        msghdr message{};
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        const ssize_t length = recvmsg(socket_, &message, MSG_CMSG_CLOEXEC);
        if (length < 0) {
            return std::nullopt;
        }
        Datagram datagram{std::string(buffer.data(), static_cast<std::size_t>(length))};
        if (const cmsghdr* const header = CMSG_FIRSTHDR(&message); header != nullptr) {
            EXPECT_EQ(header->cmsg_type, SCM_RIGHTS);
            std::memcpy(&datagram.file, CMSG_DATA(header), sizeof(int));
        }
        return datagram;
    }

    Fields receiveFields() const {
        const std::optional<Datagram> datagram = receive();
        EXPECT_TRUE(datagram);
        return datagram ? parse(datagram->bytes) : Fields();
    }

    static Fields parse(std::string_view bytes) {
        Fields fields;
        while (!bytes.empty()) {
            const auto end = bytes.find_first_of("=\n");
            if (end == std::string_view::npos) {
                ADD_FAILURE() << "a field has no end";
                return fields;
            }
            const std::string name(bytes.substr(0, end));
            const bool counted = bytes[end] == '\n';
            bytes.remove_prefix(end + 1);
            const std::size_t length = counted ? takeLength(bytes) : bytes.find('\n');
            if (length >= bytes.size() || bytes[length] != '\n') {
                ADD_FAILURE() << name << " does not end in a line end";
                return fields;
            }
            fields.emplace_back(name, bytes.substr(0, length));
            bytes.remove_prefix(length + 1);
        }
        return fields;
    }

private:
    static std::size_t takeLength(std::string_view& bytes) {
        std::size_t length = 0;
        for (std::size_t index = 0; index < 8; ++index) {
            length |= std::size_t{static_cast<unsigned char>(bytes[index])} << (8 * index);
        }
        bytes.remove_prefix(8);
        return length;
    }

    const int socket_;
};

LogRecord recordOf(LogLevel level, std::string_view text) {
    return {.level = level,
            .subsystem = "com.orvex.vela",
            .category = "velarr",
            .sourceName = "VelaReportingSession",
            .sourceFile = "session/VelaReportingSession.cpp",
            .line = 42,
            .text = text,
            .message = text,
            .reporter = std::nullopt};
}

class JournalLogTest : public ::testing::Test {
protected:
    std::unique_ptr<JournalLog> open() {
        auto log = JournalLog::open("vela-test", folder_ / "socket");
        EXPECT_TRUE(log);
        return std::move(log).operator*();
    }

    const testing::TemporaryFolder folder_;
    std::optional<Journal> journal_{std::in_place, folder_ / "socket"};
};

TEST_F(JournalLogTest, ALineIsOneDatagramOfFields) {
    const auto log = open();
    LogRecord record = recordOf(LogLevel::Info, "     VelaReportingSession:42    starting session owned by -7");
    record.message = "starting session owned by -7";
    record.reporter = -7;
    log->write(record);
    EXPECT_THAT(journal_->receiveFields(),
                ElementsAre(Pair("MESSAGE", "     VelaReportingSession:42    starting session owned by -7"),
                            Pair("PRIORITY", "6"), Pair("SYSLOG_IDENTIFIER", "vela-test"),
                            Pair("SUBSYSTEM", "com.orvex.vela"), Pair("CATEGORY", "velarr"),
                            Pair("SOURCE_NAME", "VelaReportingSession"),
                            Pair("CODE_FILE", "session/VelaReportingSession.cpp"), Pair("CODE_LINE", "42"),
                            Pair("VELA_REPORTER_ID", "-7")));
    EXPECT_FALSE(journal_->receive());
    EXPECT_EQ(log->lost(), 0U);
}

TEST_F(JournalLogTest, TheBytesOfALineAreThoseOfTheProtocol) {
    const auto log = open();
    log->write(recordOf(LogLevel::Error, "text"));
    EXPECT_EQ(journal_->receive()->bytes,
              "MESSAGE=text\nPRIORITY=3\nSYSLOG_IDENTIFIER=vela-test\nSUBSYSTEM=com.orvex.vela\nCATEGORY=velarr\n"
              "SOURCE_NAME=VelaReportingSession\nCODE_FILE=session/VelaReportingSession.cpp\nCODE_LINE=42\n");
}

TEST_F(JournalLogTest, AValueOfTwoLinesCarriesItsLength) {
    const auto log = open();
    log->write(recordOf(LogLevel::Info, "first\nsecond"));
    const std::optional<Datagram> datagram = journal_->receive();
    ASSERT_TRUE(datagram);
    EXPECT_TRUE(datagram->bytes.starts_with(std::string("MESSAGE\n\x0c\0\0\0\0\0\0\0first\nsecond\nPRIORITY=", 38)));
    EXPECT_EQ(Journal::parse(datagram->bytes)[0].second, "first\nsecond");
    EXPECT_EQ(Journal::parse(datagram->bytes).size(), 8U);
}

TEST_F(JournalLogTest, AValueCannotBecomeAField) {
    const auto log = open();
    log->write(recordOf(LogLevel::Info, "text\nPRIORITY=0\n"));
    const Fields fields = journal_->receiveFields();
    ASSERT_EQ(fields.size(), 8U);
    EXPECT_THAT(fields[0], Pair("MESSAGE", "text\nPRIORITY=0\n"));
    EXPECT_THAT(fields[1], Pair("PRIORITY", "6"));
}

TEST_F(JournalLogTest, LevelsHaveThePrioritiesOfSyslog) {
    const auto log = open();
    std::vector<std::string> priorities;
    for (const LogLevel level : {LogLevel::Debug, LogLevel::Info, LogLevel::Default, LogLevel::Error}) {
        log->write(recordOf(level, "text"));
        priorities.push_back(journal_->receiveFields().at(1).second);
    }
    EXPECT_THAT(priorities, ElementsAre("7", "6", "5", "3"));
}

TEST_F(JournalLogTest, WhatIsTooLargeForADatagramGoesByASealedFile) {
    const auto log = open();
    const std::string text = "large " + std::string(4 * 1024 * 1024, 'x') + "\nend";
    log->write(recordOf(LogLevel::Info, text));
    const std::optional<Datagram> datagram = journal_->receive();
    ASSERT_TRUE(datagram);
    EXPECT_EQ(datagram->bytes, "");
    ASSERT_GE(datagram->file, 0);
    EXPECT_EQ(fcntl(datagram->file, F_GET_SEALS), F_SEAL_SEAL | F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_WRITE);
    std::string content(static_cast<std::size_t>(lseek(datagram->file, 0, SEEK_END)), '\0');
    EXPECT_EQ(pread(datagram->file, content.data(), content.size(), 0), static_cast<ssize_t>(content.size()));
    close(datagram->file);
    const Fields fields = Journal::parse(content);
    ASSERT_EQ(fields.size(), 8U);
    EXPECT_EQ(fields[0].first, "MESSAGE");
    EXPECT_TRUE(fields[0].second == text);
    EXPECT_THAT(fields[7], Pair("CODE_LINE", "42"));
    EXPECT_EQ(log->lost(), 0U);
}

TEST_F(JournalLogTest, WhatAFullJournalDoesNotTakeIsCounted) {
    const auto log = open();
    std::uint64_t written = 0;
    // The socket takes a few hundred datagrams at the most; without an end the loop would say so.
    for (; log->lost() < 3 && written < 1000000; ++written) {
        log->write(recordOf(LogLevel::Info, "text"));
    }
    ASSERT_EQ(log->lost(), 3U);
    std::uint64_t received = 0;
    while (journal_->receive()) {
        ++received;
    }
    EXPECT_EQ(received, written - 3);
    log->write(recordOf(LogLevel::Info, "after"));
    EXPECT_THAT(journal_->receiveFields().at(0), Pair("MESSAGE", "after"));
    EXPECT_EQ(log->lost(), 3U);
}

TEST_F(JournalLogTest, AJournalThatWasRestartedIsFoundAgain) {
    const auto log = open();
    journal_.reset();
    log->write(recordOf(LogLevel::Info, "lost"));
    EXPECT_EQ(log->lost(), 1U);
    ASSERT_EQ(unlink((folder_ / "socket").c_str()), 0);
    journal_.emplace(folder_ / "socket");
    log->write(recordOf(LogLevel::Info, "found"));
    EXPECT_THAT(journal_->receiveFields().at(0), Pair("MESSAGE", "found"));
    EXPECT_EQ(log->lost(), 1U);
}

TEST_F(JournalLogTest, LinesOfManyThreadsArriveOrAreCounted) {
    const auto log = open();
    constexpr int kLines = 500;
    std::vector<std::thread> threads;
    threads.reserve(4);
    for (int thread = 0; thread < 4; ++thread) {
        threads.emplace_back([&log] {
            for (int line = 0; line < kLines; ++line) {
                log->write(recordOf(LogLevel::Info, "text of a thread"));
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    std::uint64_t received = 0;
    for (std::optional<Datagram> datagram = journal_->receive(); datagram; datagram = journal_->receive()) {
        EXPECT_THAT(Journal::parse(datagram->bytes).at(0), Pair("MESSAGE", "text of a thread"));
        ++received;
    }
    EXPECT_GT(received, 0U);
    EXPECT_EQ(received + log->lost(), 4U * kLines);
}

TEST(JournalLogOpenTest, WithoutASocketThereIsNoJournal) {
    const testing::TemporaryFolder folder;
    const auto log = JournalLog::open("vela-test", folder / "missing");
    ASSERT_FALSE(log);
    EXPECT_EQ(log.failure().code, ENOENT);
    EXPECT_EQ(log.failure().description, "journal socket " + (folder / "missing") + ": No such file or directory");
}

TEST(JournalLogOpenTest, WhatIsNoSocketIsNoJournal) {
    const testing::TemporaryFolder folder;
    EXPECT_EQ(JournalLog::open("vela-test", folder.path()).failure().code, ENOTSOCK);
}

TEST(JournalLogOpenTest, APathTooLongForASocketIsRefused) {
    EXPECT_EQ(JournalLog::open("vela-test", "/" + std::string(107, 'a')).failure().code, ENAMETOOLONG);
}

} // namespace

} // namespace vela::platform
