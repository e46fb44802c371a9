// JSON values as text and back, and reading members of values that nobody has checked yet.
//
// JsonCpp throws on a value of the wrong type, on an integer out of range and on deep nesting.
// These helpers are where that ends: none of them throws but std::bad_alloc, and all of them look
// at values through const access only, so that reading never inserts a member.

#ifndef ZELO_JSON_H
#define ZELO_JSON_H

#include <json/value.h>

#include <cstddef>
#include <string>

namespace json {

// The deepest nesting that is read or written; what is deeper fails. The same both ways, so that
// everything written can be read back.
constexpr int kMaxDepth = 1000;

// The most values that are read: a value takes a hundred times the memory of the text "0,".
constexpr std::size_t kMaxValues = 2'000'000;

// Writes the value as compact JSON text, on one line and in ASCII, without a line feed at its end.
// Returns false, and leaves strText as it was, when the value has more levels than maxDepth.
bool ToString(const Json::Value &value, std::string &strText, int maxDepth = kMaxDepth);

// The same for a log line: a value that cannot be written reads as "...".
std::string ToLogText(const Json::Value &value);

// Parses the text into the value; returns whether it succeeded. On failure the value is unchanged
// and, when pstrError is given, *pstrError says where and why in one line.
bool FromString(const std::string &strText, Json::Value &value, std::string *pstrError = nullptr);

// The member of an object; null (the shared null value) when there is none or the value is no
// object. The result lives as long as the value.
const Json::Value &Member(const Json::Value &object, const char *szKey);

// Whether the value is an object that has the member (also when the member is null).
bool HasMember(const Json::Value &object, const char *szKey);

// The text of a string value, null for any other type. A string that holds a NUL character reads as
// null too: as zero-terminated text it would be another one. The result lives as long as the value.
const char *Text(const Json::Value &value);

// Reads a number whose value is an integer that fits an int, however it is written (443, 443.0,
// 4.43e2). Nothing else is one, and n stays as it was.
bool ReadInt(const Json::Value &value, int &n);

// Whether the value says yes: boolean true, or a number other than zero. Any other type says no.
bool IsTrue(const Json::Value &value);

// "error"."code" of a response envelope; 0 when it is not there, of another type, or beyond an int.
int ErrorCode(const Json::Value &reply);

}  // namespace json

#endif
