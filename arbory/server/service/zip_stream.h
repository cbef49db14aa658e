#pragma once
// A zip archive as it goes to a client: made while it is sent, in chunks of HTTP, and never held.
// An archive of more than four gigabytes or 65,535 files is in the larger form of the format.
//
// Names are bytes: those that are UTF-8 are marked as such, which every unpacker understands;
// others are written as they are, unmarked, and come out the same on systems like this one.

#include <sys/stat.h>

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

struct archive;

namespace arbory {

// For the one thread of a child: it sets the locale, from which the library takes how names are
// marked.
class ZipStream {
 public:
  explicit ZipStream(int pipe);
  ~ZipStream();
  ZipStream(const ZipStream&) = delete;
  ZipStream& operator=(const ZipStream&) = delete;

  // A folder, empty or not.
  void AddFolder(const std::string& name, const struct stat& info);
  // The file open at `fd`, as long as `info` says: what is missing by then is filled up with zeros,
  // what has grown is left out. False where bytes could not be read.
  bool AddFile(const std::string& name, int fd, const struct stat& info);
  void AddText(const std::string& name, std::string_view text);
  // The end, without which a client knows that it has not got all.
  void Finish();

  // Nobody takes the archive any more; all that is added goes nowhere.
  bool broken() const { return broken_; }

 private:
  bool Begin(const std::string& name, const struct stat& info, bool packs);
  void Write(std::string_view bytes);

  struct Chunks;
  const std::unique_ptr<Chunks> chunks_;
  archive* const archive_;
  bool broken_ = false;
};

}  // namespace arbory
