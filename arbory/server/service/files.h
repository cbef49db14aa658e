#pragma once
// One file of a share, sent to a client by a child that is the user for good: the system's own
// rules decide what it may open, and a disk that must first spin up keeps nobody else waiting.
// Files of a fleet's boxes are sent through the front (fleet_files.h).

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "arbory/server/transport/http.h"

namespace arbory {

struct FileRequest {
  std::string user;
  std::string share;                 // "home": the user's own folder in the share "homes"
  std::vector<std::string> path;     // below the share
  bool preview = false;              // shown by the browser instead of saved, where that is safe
  std::optional<std::string> range;  // the Range field
  bool head_only = false;
  // Says in the child whether anybody may ask for this user (fronts.h); null: the user does.
  std::function<std::optional<nas::Reply>()> admit = {};
};

// Forks the child, which replies 200, 206 or 416 with the file's fields and bytes, or an error's
// status and JSON; one whose file became shorter meanwhile ends in the midst of it. The pid is -1
// when nothing can be forked.
nas::Child StartFile(const FileRequest& request);

// Forks the child that looks for the first line of the file that holds what `pattern` asks for:
// {"line": number, "parts": [text, marked text, text, ...]}, with `line` null where there is none.
// `with_text`: and {"text": {"first_line", "text", "before", "after"}}, what lies around that line
// or at the beginning, in whatever encoding the file is; null for what is no text. Refuses a
// pattern that cannot be understood with 400, files as StartFile does.
nas::Child StartFirstLine(const FileRequest& request, const std::string& pattern, bool with_text);

// The bytes that a Range field asks for of a file of `size` bytes. Nothing to ask for (no field,
// several ranges, or none that is understood) gives the whole file; `satisfiable` tells whether the
// file has any of the bytes.
struct ByteRange {
  std::uint64_t first = 0;
  std::uint64_t count = 0;
  bool partial = false;
  bool satisfiable = true;
};
ByteRange ParseRange(const std::optional<std::string>& field, std::uint64_t size);

// For the child: what stands before these bytes of a file, and what is answered where the file has
// none of those that were asked for.
nas::ReplyHead FileHead(const FileRequest& request, std::uint64_t size, std::time_t modified,
                        const ByteRange& range);
nas::Reply NoSuchBytes(std::uint64_t size);

// What a browser may show of a file by its name's extension: types that carry no scripts. Nothing
// for all others, which are only ever saved.
std::optional<std::string> PreviewType(const std::string& name);

}  // namespace arbory
