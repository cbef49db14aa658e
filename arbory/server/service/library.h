#pragma once
// What only a server needs of other libraries: archives, and the machine's accounts by PAM. It lies
// in a library of its own, so that all others, who start in milliseconds, do not load these with a
// dozen more that they need: that was a third of a program's start.

#include <sys/stat.h>

#include <string>
#include <string_view>

#include "arbory/server/service/login.h"
#include "nas/system/child.h"

namespace arbory {

// A zip archive as it goes to a client: made while it is sent, in chunks of HTTP, and never held.
// An archive of more than four gigabytes or 65,535 files is in the larger form of the format.
//
// Names are bytes: those that are UTF-8 are marked as such, which every unpacker understands;
// others are written as they are, unmarked, and come out the same on systems like this one.
//
// For the one thread of a child: it sets the locale, from which the library takes how names are
// marked.
class ZipStream {
 public:
  virtual ~ZipStream() = default;
  // A folder, empty or not.
  virtual void AddFolder(const std::string& name, const struct stat& info) = 0;
  // The file open at `fd`, as long as `info` says: what is missing by then is filled up with zeros,
  // what has grown is left out. False where bytes could not be read.
  virtual bool AddFile(const std::string& name, int fd, const struct stat& info) = 0;
  // The same in pieces, of a file that is not here. Where the first is false the others are not to
  // be called.
  virtual bool BeginFile(const std::string& name, const struct stat& info) = 0;
  virtual void AddBytes(std::string_view bytes) = 0;
  virtual bool EndFile() = 0;
  virtual void AddText(const std::string& name, std::string_view text) = 0;
  // The end, without which a client knows that it has not got all.
  virtual void Finish() = 0;
  // Nobody takes the archive any more; all that is added goes nowhere.
  virtual bool broken() const = 0;
};

struct ServerLibrary {
  // The caller deletes it.
  ZipStream* (*new_zip)(int pipe);
  // What the children of login.h reply.
  nas::ReplyHead (*check_login)(const Credentials& credentials, const PamService& service);
  nas::ReplyHead (*check_account)(const std::string& user, const PamService& service);
};

// What the library exports, under this name.
inline constexpr char kServerLibraryEntry[] = "ArboryServerLibrary";
using ServerLibraryEntry = const ServerLibrary* (*)();

// Loads it on the first call; throws std::runtime_error where it cannot be loaded. Called in the
// children that need it, while they are who the server is, so that all others are forked from
// less.
const ServerLibrary& LoadServerLibrary();

}  // namespace arbory
