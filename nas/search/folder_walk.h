#pragma once
// The walk over the folders of locations, as a source of names. Which folders it enters stands in
// folder_gate.h. What cannot be read is counted and left out.

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

  void Push(std::uint16_t number, const Location& location);
  void ReadFolder(const FolderStack::Item& item, UniqueFd fd, Reading& reading);

  const std::vector<Location>& locations_;
  SharedSearch& search_;
  const FolderGate gate_;
  FolderStack stack_;
};

}  // namespace nas
