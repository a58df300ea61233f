// What ipc_benchmark measures: a server process, and clients of it in this one.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <sys/types.h>
#include <vector>

namespace vela::ipcbench {

/// One client's connection. Confined to one thread at a time. What fails ends the program with a word.
class Channel {
public:
    virtual ~Channel() = default;

    /// Sends message `number`, at `flush` at the latest. With `reply`, one comes, in the order of the messages.
    virtual void post(std::int64_t number, bool reply) = 0;
    virtual void flush() {}
    /// Waits for the next reply.
    virtual void takeReply() = 0;
    /// Both, as a program does that has nothing else to do.
    virtual void call(std::int64_t number) {
        post(number, true);
        flush();
        takeReply();
    }
};

/// A server that runs, with its clients. It ends with the object.
class Running {
public:
    virtual ~Running() = default;

    pid_t process() const { return process_; }
    /// Deliveries that it gave up, of all that it was to make.
    virtual double lostShare() { return 0; }
    std::vector<std::unique_ptr<Channel>>& channels() { return channels_; }

protected:
    pid_t process_ = -1;
    std::vector<std::unique_ptr<Channel>> channels_;
};

struct Subject {
    std::string name;
    /// Starts a server with so many clients, connected and ready to send.
    std::function<std::unique_ptr<Running>(unsigned clients)> start;
};

Subject echoSubject();
/// Without a start function where the library is not there.
Subject sdBusSubject();
Subject serviceSubject();

/// Ends the program with `what` and the system's word for errno, where `good` is false.
void require(bool good, const char* what);

/// A server that is a fork of this program: `serve(listener, clients)` runs in it until it is killed.
class ForkedServer : public Running {
public:
    ForkedServer(const std::string& path, int socketType, unsigned clients,
                 const std::function<void(int listener, unsigned clients)>& serve);
    ForkedServer(const ForkedServer&) = delete;
    ForkedServer& operator=(const ForkedServer&) = delete;
    ~ForkedServer() override;

    template <class Connect>
    void connect(unsigned clients, const Connect& makeChannel) {
        for (unsigned client = 0; client < clients; ++client) {
            channels_.push_back(makeChannel());
        }
    }

private:
    const std::string path_;
};

/// A path for a server's socket.
std::string socketPath(const char* name);
/// A connected socket.
int connectedSocket(const std::string& path, int socketType);

} // namespace vela::ipcbench
