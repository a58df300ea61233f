// All rings of a folder, while a session collects. Takes up rings as their emitters make them; reads those of emitters
// that are gone to their end and removes them. What is in the folder and is no ring is passed over. Confined to its
// owner's lock.
#pragma once

#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"
#include "platform/spoor/RingReader.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <sys/stat.h>
#include <vector>

namespace vela::platform::spoor {

class RingFolder {
public:
    // The events of rings beyond these are lost: they are counted when all is drained, and told once in the log.
    static constexpr std::size_t kMostRings = 512;
    static constexpr std::size_t kMostRingsOfUser = 256;
    /// Names in the folder that are looked at. What comes beyond them is told once in the log, and not counted.
    static constexpr std::size_t kMostNames = 4096;

    explicit RingFolder(std::string path) : path_(std::move(path)) {}

    /// Passes over what the rings hold already, and removes those of dead emitters.
    Result<Done> begin();
    void end();

    /// Appends what has come since the last time, ring by ring. `all`: looks for new rings even where the folder seems
    /// untouched, reads on until nothing comes, and counts what is lost in rings without room.
    void drain(bool all, std::vector<TraceRecord>& records, std::uint64_t& lost);

    std::size_t rings() const { return rings_.size(); }

private:
    struct Ring {
        FileDescriptor file;
        uid_t owner = 0;
        bool refused = false; ///< it is no ring
        RingReader reader;
    };

    /// Whether names may have come since the last listing.
    bool isTouched();
    void list(bool isFirst);
    void takeUp(const std::string& name, bool isFirst);
    bool hasRoom(uid_t owner) const;
    void leave(const std::string& name, Ring ring);
    void countUnread(std::uint64_t& lost);
    bool readRing(Ring& ring, std::vector<TraceRecord>& records, std::uint64_t& lost);
    void removeFile(const std::string& name, const Ring& ring);
    void sweepTemporary(const std::string& name);

    const std::string path_;
    FileDescriptor folder_;
    struct timespec changed_ {};    ///< the folder's own time
    std::uint64_t seenChanged_ = 0; ///< when that was first seen
    std::uint64_t checked_ = 0;     ///< when it was last looked whose emitter lives
    std::map<std::string, Ring, std::less<>> rings_;
    std::map<std::string, Ring, std::less<>> unread_; ///< without room; none is open, and at most as many as names
    bool toldOfRings_ = false;
    bool toldOfNames_ = false;
    std::uint64_t passed_ = 0; ///< lost events of rings that were without room and now have it
};

} // namespace vela::platform::spoor
