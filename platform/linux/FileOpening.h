// Opens files that somebody else named, with that one's rights. Thread-safe and without state.
//
// A service that may change its user (CAP_SETUID and CAP_SETGID) lets the kernel decide: it goes to the file on a
// thread of its own that has the reader's user and groups for file systems and no capability, and ends with it. That
// thread makes the kernel forbid the process's core dumps; they are allowed again afterwards if they were before.
//
// Any other service decides by itself, from what it may open: of every folder on the way the reader needs the right to
// search, of the file the right to read. As in the kernel the first that fits counts: the owner's three bits for the
// owner, the group's for who is in the group, the others' bits. Root may do everything. A folder or file with an access
// list is refused to all but root, as its bits do not tell the whole.
#pragma once

#include "platform/Identity.h"
#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"

#include <string>

namespace vela::platform {

/// For reading. Nothing but a regular file is ever opened. The path is walked by this process, link by link, so that
/// the links in /proc which lead anywhere are texts like all others. A path, with the links on it, has less than 4,096
/// bytes.
Result<FileDescriptor> openFor(const Identity& reader, const std::string& path);

} // namespace vela::platform
