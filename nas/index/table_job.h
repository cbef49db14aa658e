#pragma once
// A child of the watcher that does what takes long: reading folders and writing tables. It is
// forked with all that the watcher has, so table and changes are a snapshot; what it finds comes
// back through a pipe, taken as it comes, and its end is the pipe's end.

#include <sys/types.h>

#include <functional>
#include <memory>
#include <string>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"

namespace nas {

class TableJob {
 public:
  // Forks the child, which runs `body` and ends with what it returns: 0, or an errno. It goes when
  // its parent goes. `idle`: it gets the disk when nobody else wants it.
  static Result<std::unique_ptr<TableJob>> Start(bool idle,
                                                 const std::function<int(int pipe)>& body);
  // Ends the child if it still runs, and waits for that.
  ~TableJob();
  TableJob(const TableJob&) = delete;
  TableJob& operator=(const TableJob&) = delete;

  int fd() const { return pipe_.get(); }  // readable, O_NONBLOCK
  pid_t pid() const { return pid_; }
  // Takes what has come. True once the child has ended, or has said more than it may.
  bool Read();
  // After Read was true: 0, or the errno that the child failed with; EIO where it died.
  int Finish();
  const std::string& output() const { return output_; }

 private:
  TableJob(pid_t pid, UniqueFd pipe) : pid_(pid), pipe_(std::move(pipe)) {}
  pid_t pid_;
  UniqueFd pipe_;
  std::string output_;
};

}  // namespace nas
