#pragma once
// The texts of HTTP: targets, cookies, fields and the bodies of errors. Functions of their
// arguments alone, for the loop and for children alike; none throws but for want of memory. Nothing
// here needs the network library, which has fields and reason phrases (connection.cpp uses them)
// but neither cookies, targets nor ranges.

#include <json/value.h>

#include <ctime>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "arbory/server/transport/http.h"

namespace arbory {

// The segments of a path, decoded once; none for "/". Nothing when it does not begin with "/", or a
// segment is empty, even a final one, "." or "..", or holds after decoding a "/" or a NUL, or
// an incomplete escape: none may mean another place than it seems to, and a proxy's rule for
// "/metrics" must not be passed by as "/metrics/". They may hold any other byte, as names do.
std::optional<std::vector<std::string>> SplitPath(std::string_view path);
// The value of a parameter in a query; nothing when it is not there or badly encoded.
std::optional<std::string> QueryValue(std::string_view query, std::string_view name);
// Makes a target in the absolute form, which proxies and some programs send, one of the usual form:
// its host takes the place of the Host field's.
void UseHostOfTarget(HttpRequest* request);
// Encodes all but letters, digits and "-._~".
std::string PercentEncoded(std::string_view text);

// The value of the first cookie of that name, as it stands; empty when it is not there.
std::string Cookie(const HttpRequest& request, std::string_view name);

// The field Content-Disposition with the name in both forms, the plain one for old clients. Without
// the characters that turn the direction of text: a name must show its extension where it is.
std::string ContentDisposition(bool inline_shown, const std::string& name);

// "Sat, 21 Nov 2026 22:28:36 GMT".
std::string HttpDate(std::time_t time);
// Of ASCII letters; other bytes stay.
std::string LowerCase(std::string_view text);

// The parameters in a request's body, a JSON object; an empty one for an empty body, and nothing
// for any other, which BadBodyReply answers. Takes time and memory: in the loop for small bodies
// only.
std::optional<Json::Value> JsonBody(const std::string& body);
HttpReply BadBodyReply();

// `body` is JSON already. Never kept by a cache.
HttpReply JsonReply(int status, std::string body);
// As a child sends it.
nas::Reply AsChildsReply(HttpReply reply);
// {"code":STATUS,"error":SENTENCE}, or with a code of its own.
HttpReply ErrorReply(int status, std::string_view sentence);
HttpReply ErrorReply(int status, int code, std::string_view sentence);
// 405, with the methods as the field Allow has them.
HttpReply NotAllowedReply(const std::string& allowed_methods);
// With Retry-After.
HttpReply BusyReply(int status, std::string_view sentence, const std::string& retry_seconds);

}  // namespace arbory
