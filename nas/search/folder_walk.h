#pragma once
// The walk over the folders of locations, as a source of names. Which folders it enters stands in
// folder_gate.h. What cannot be read is counted and left out. Other sources have one for the parts
// of a tree that they do not know.

#include <cstdint>
#include <string>
#include <vector>

#include "nas/files/directory_reader.h"
#include "nas/search/folder_gate.h"
#include "nas/search/folder_stack.h"
#include "nas/search/location.h"
#include "nas/search/name_source.h"

namespace nas {

class FolderWalk : public NameSource {
 public:
  // Everything is borrowed. Not `recursive`: only the entries of the locations themselves. A
  // location given twice is walked once.
  FolderWalk(const std::vector<Location>& locations, bool recursive, SharedSearch& search);
  // One that begins nowhere, and ends once it has walked what it is told below and nobody holds it.
  FolderWalk(const std::vector<Location>& locations, FolderGate gate, SharedSearch& search);

  // While it is held, more may be told. `thread` is the caller's, as in Feed.
  void Hold() { stack_.Hold(); }
  void Release() { stack_.Release(); }
  // A location, by its number.
  void Begin(size_t thread, std::uint16_t number);
  // The folder `name` of the one open at `parent`, whose path below the root of the location's
  // share is `parent_path`; with the ignore files of that one.
  void Add(size_t thread, std::uint16_t number, UniqueFd parent, std::string parent_path,
           std::string_view name, IgnoreFiles::Ptr ignores);

  void Feed(size_t thread, Judge& judge) override;
  void Abort() override { stack_.Abort(); }

 private:
  // One thread's.
  struct Reading {
    size_t thread;
    Judge& judge;
    DirectoryReader reader;
    std::string path;  // of the folder being read
  };

  void ReadFolder(const FolderStack::Item& item, UniqueFd fd, Reading& reading);

  const std::vector<Location>& locations_;
  SharedSearch& search_;
  const FolderGate gate_;
  FolderStack stack_;
};

}  // namespace nas
