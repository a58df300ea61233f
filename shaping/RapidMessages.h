// Merges bursts of messages: a client that reports one setting as several messages within a moment counts as having
// sent one. A pure function, callable from any thread; it writes no log.
#pragma once

#include "common/values/Dictionary.h"
#include "shaping/StoredMessage.h"

#include <span>
#include <vector>

namespace vela {

/// The messages in their order, where those that hold any of `keysToCombine` (whatever its value) and follow each other
/// by at most `maximumPausetime` seconds are one new dictionary with all their entries, the later values winning. All
/// other messages come out as the same objects that went in.
///
/// - The pause is measured from the combinable message before, however long the burst; time that runs backwards is no
///   pause. Other messages in between do not end a burst.
/// - A combined message stands where its first member stood. Its time is the last one that a member had, so it may be
///   later than that of messages behind it.
/// - The time of a message is its "velareporting_timestamp" as a number: 0 where it is absent or no number. After a
///   combinable message without one, the next joins however late it comes.
/// - Takes time and memory in proportion to the messages and their entries.
std::vector<Dictionary> combineRapidMessages(std::span<const StoredMessage> messages,
                                             std::span<const Key> keysToCombine, double maximumPausetime);

} // namespace vela
