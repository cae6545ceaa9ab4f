#pragma once

#include <QtGlobal>

// The bounds on everything this system reads from outside: the management server's replies,
// the clients' request arguments and the commands the simulated server takes. Each reader, the
// XML converter, the query composer and the simulated server take their bounds from here, so
// that a text one part accepts is not refused by the next one.
namespace AlarmSearchLimits {

// Deepest element nesting read, the document element at depth 1. Deeper text is refused as a
// whole: the DOM's parser, destructor and writer recurse once per level, and a few thousand
// levels overflow a thread's stack. Real replies and filters nest below ten levels.
constexpr int MaxDepth = 256;

// Longest reply text read, in UTF-16 code units (128 MiB); longer text counts as not parseable.
// A reply of 50 000 alarms is about 31 Mi units.
constexpr qsizetype MaxReplyLength = qsizetype(64) * 1024 * 1024;

// Most elements in one reply. Every element becomes an entry of the answer, a hundred bytes or
// more, so the count bounds the answer's memory where the length alone would allow millions of
// empty elements. The largest reply read on purpose, 50 000 alarms of a dozen fields, holds
// about 600 000.
constexpr qsizetype MaxReplyElements = qsizetype(1024) * 1024;

// Most alarms in one alarm-list reply. A query asks for at most MaxRecords, so a longer list
// is not an answer to it; the bound leaves room for servers that page on their own.
constexpr qsizetype MaxReplyAlarms = 50000;

// The most alarms a query asks the server for.
constexpr int MaxRecords = 5000;

// Most attributes on one element. QXmlStreamReader compares every attribute with each one
// before it, so its time grows with the square of the count; servers write one or two.
constexpr int MaxAttributes = 64;

// Longest XML fragment of a request (the trigger-event and state filters), in UTF-16 code
// units. A filter of every event class of a system is a few KiB.
constexpr qsizetype MaxFragmentLength = qsizetype(1024) * 1024;

// Longest line of requests the command-line client's batch reads, in bytes; a line holds one
// request, its filters within MaxFragmentLength each.
constexpr qsizetype MaxRequestLineBytes = qsizetype(16) * 1024 * 1024;

} // namespace AlarmSearchLimits
