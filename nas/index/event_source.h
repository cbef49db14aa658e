#pragma once
// What happens in a file system, as the kernel tells it. Two sources: fanotify of a whole file
// system, for root, and inotify of single folders, for anybody.

#include <cstdint>
#include <string>
#include <string_view>

#include "nas/base/error.h"
#include "nas/index/folder_key.h"

namespace nas {

// Whoever is told. Folders are told by their keys, known or not.
class EventSink {
 public:
  virtual ~EventSink() = default;
  // Something happened to that name of the folder. What is there now, nobody has looked.
  virtual void NameChanged(std::string_view folder, std::string_view name) = 0;
  // The same, and it may be a folder that others know nothing of yet, with all below it.
  virtual void TreeCame(std::string_view folder, std::string_view name) = 0;
  // The folder's own attributes may have changed.
  virtual void FolderChanged(std::string_view folder) = 0;
  // The attributes of a file changed by a name that is not told.
  virtual void InodeChanged(std::uint64_t inode) = 0;
  // Events were lost.
  virtual void Lost() = 0;
};

// For one thread. What is inherited by a forked child is the same queue.
class EventSource {
 public:
  virtual ~EventSource() = default;
  // Readable when there are events; O_NONBLOCK.
  virtual int fd() const = 0;
  // How much waits in the queue, in a measure of the source's own; all that happened before the
  // call is in it.
  virtual size_t Waiting() const = 0;
  // Takes events off the queue and tells them, as long as there are any and less than `much` was
  // taken. Returns how much it took, in the same measure.
  virtual size_t Take(size_t much, EventSink& sink) = 0;
  // Whether writes to files and changes of attributes are told of every file, so that what nobody
  // was told of has not changed.
  virtual bool TellsAttributes() const = 0;
};

}  // namespace nas
