#pragma once
// Whole-file reading and writing of JSON documents, which JsonCpp's value type itself lacks.

#include <json/value.h>

#include <string>

namespace Json {

// Reads the file as one JSON document. False with errno set, and `out` untouched, when it is
// missing, unreadable or not valid JSON (EBADMSG).
bool fromFile(const std::string& path, Value& out);

// Replaces the file's content with the value as JSON text. The old content stays whole until the
// new one is complete, also in a power cut; a file that existed keeps its mode. False with errno
// set on failure.
bool toFile(const std::string& path, const Value& value);

}  // namespace Json
