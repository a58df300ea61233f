// The one textual form of a value: in log lines, summaries and whatever else shows a value as text.
//
// A string is itself, a number its shortest digits (1 and 0 for booleans), data "<0fbd77>", a date
// "2026-11-21 02:43:25 +0000", none "(null)". A container is written in the old text form of property lists on one
// line,
// `{audiotag = GenericStart; list = (1, "two words");}`, so that it can be read back as one; every leaf is text there.
// Invalid UTF-8 inside a container becomes U+FFFD, a control character an escape.
#pragma once

#include "common/values/Value.h"

#include <string>

namespace vela {

std::string textualForm(ValueRef value);
void appendTextualForm(std::string& text, ValueRef value);

/// "2026-11-21 02:43:25 +0000"; "(invalid date)" for a date that is not a number or beyond the year 9999 or before 1.
void appendDate(std::string& text, Date date);
/// "2026-11-21T02:43:25Z", with milliseconds where the date has a fraction; false, appending nothing, for what
/// `appendDate` calls invalid.
bool appendIso8601(std::string& text, Date date);

} // namespace vela
