#pragma once
// The web file manager library: umask, identity, error codes, splitting of parameters, and the
// rendering of file entries. None of it may be called from more than one thread of a process.

#include <json/value.h>
#include <sys/types.h>

#include <cstdint>
#include <map>
#include <string>

// Sets the umask that file-manager work uses (077: what is written is its owner's alone) and
// returns the previous one.
unsigned int WfmLibUmask();
void WfmLibRestoreUmask(unsigned int mask);

// Switches the process to `user`: user id, primary group and supplementary groups. A process that
// started as root keeps root as its saved identity and can switch again; any other process can
// only "switch" to the user it already runs as. `session` may be null; it is not needed to find
// the user. Returns 0, or -1 with the last error (WfmLibGetErr, NLIBCErrGet) and errno set.
int WfmLibUGIDSet(const char* session, const char* user);

// The web API error code of the last failed operation of this library or of the search engine:
// WfmParseErrnoToError of the last platform error number.
int WfmLibGetErr();

// Maps a platform error number (see NLIBCErrGet) to the web API error code of errors.h that means
// the same, kFailed where none does. The paths name what the error is about and do not change the
// code; either may be null.
int WfmParseErrnoToError(int error, const char* path, const char* other_path);

// Splits a request parameter into a JSON array of strings. An array of strings is returned as it
// is; in any other, numbers and truth values become their text and what has none is left out. A
// string is split at `separator`; a backslash before a separator keeps that separator as part of
// the piece. From API version 2 on, a string that is the text of a JSON array stands for that
// array. `drop_empty` leaves out the empty pieces of a string. An empty string gives an empty
// array, as does any other type of value. Throws for a list of more than 4,096 values, which the
// caller lets pass: the request is answered as a bad one.
Json::Value StringExplodeEx(const Json::Value& value, const char* separator, int api_version,
                            bool drop_empty);

struct USER_INFO {
  std::string name;
  uid_t uid = 0;
  gid_t gid = 0;
};

struct GROUP_INFO {
  std::string name;
  gid_t gid = 0;
};

// Two caches of user and group records keyed by id, for handlers that list many files.
class WebfmUserEnum {
 protected:
  std::map<std::uint32_t, USER_INFO> user_cache_;
  std::map<std::uint32_t, GROUP_INFO> group_cache_;
};

// One file as a listing shows it.
struct DIRENTRY_INFO {
  std::string name;
  std::string path;       // as the file manager shows it: /SHARE/below
  std::string real_path;  // absolute path on the machine
  std::string type;       // extension in upper case; empty for directories
  std::uint64_t size = 0;
  std::uint32_t mode = 0;
  int acl_privilege = 0;
  bool acl_mode = false;
  std::uint32_t atime = 0;
  std::uint32_t mtime = 0;
  std::uint32_t ctime = 0;
  std::uint32_t crtime = 0;
  std::uint32_t uid = 0;
  std::string user;
  std::uint32_t gid = 0;
  std::string group;
  bool is_dir = false;
};

// Renders `entry` into the object `out`: "name", "path", "is_dir" always; and by the bits of
// `additional` "real_path" (1), "size" (2), "owner" {user, group, uid, gid} (4), "time" {atime,
// mtime, ctime, crtime} (8), "perm" {mode, privilege, acl_mode} (16), "type" (32). Names keep their
// bytes: whoever sends the reply to a client makes it valid UTF-8. The last two arguments are
// reserved and must be 0. "mode" is the permission bits as a decimal number whose digits are the
// octal ones (0644 shows as 644).
void DumpFileInfo(int additional, const DIRENTRY_INFO& entry, Json::Value& out, int reserved1,
                  int reserved2);

// What the process's user may do with the file at `path`, as bits: 1 execute or enter, 2 write,
// 4 read. 0 for a path that does not exist or is empty.
int GetACLPrivilege(const char* path);
