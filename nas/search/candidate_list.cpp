#include "nas/search/candidate_list.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <system_error>

#include "nas/base/system_call.h"

namespace nas {
namespace {

// Written and read in pieces of this size.
constexpr size_t kPieceBytes = 1024 * 1024;

[[noreturn]] void Fail(int error_number) {
  throw std::system_error(error_number, std::generic_category(), "list of files to read");
}

UniqueFd OpenTemporary(const std::string& folder) {
  UniqueFd fd(open(folder.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600));
  if (fd) return fd;
  // Some file systems have no unnamed files.
  std::string name = folder + "/candidates-XXXXXX";
  fd.Reset(mkostemp(name.data(), O_CLOEXEC));
  if (!fd) Fail(errno);
  unlink(name.c_str());
  return fd;
}

}  // namespace

CandidateList::CandidateList(const std::string& folder) : file_(OpenTemporary(folder)) {}

void CandidateList::Add(std::uint16_t location, std::string_view folder_path,
                        std::string_view names) {
  const auto length =
      static_cast<std::uint32_t>(sizeof(location) + folder_path.size() + 1 + names.size());
  const std::lock_guard lock(mutex_);
  unwritten_.append(reinterpret_cast<const char*>(&length), sizeof(length));
  unwritten_.append(reinterpret_cast<const char*>(&location), sizeof(location));
  unwritten_.append(folder_path).push_back('\0');
  unwritten_.append(names);
  if (unwritten_.size() < kPieceBytes) return;
  Write(unwritten_);
  unwritten_.clear();
}

void CandidateList::Write(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = Uninterrupted([&] {
      return pwrite(file_.get(), bytes.data(), bytes.size(), static_cast<off_t>(written_));
    });
    if (count <= 0) Fail(count < 0 ? errno : ENOSPC);
    written_ += static_cast<size_t>(count);
    bytes.remove_prefix(static_cast<size_t>(count));
  }
}

// Reads from the file and, behind its end, from what was never written to it.
void CandidateList::Read(char* to, size_t count) {
  while (count > 0) {
    if (unread_at_ == unread_.size()) {
      unread_at_ = 0;
      if (read_ == written_) {
        unread_ = std::move(unwritten_);
        unwritten_.clear();
        if (unread_.empty()) Fail(EIO);
      } else {
        unread_.resize(std::min<std::uint64_t>(kPieceBytes, written_ - read_));
        const ssize_t got = Uninterrupted([&] {
          return pread(file_.get(), unread_.data(), unread_.size(), static_cast<off_t>(read_));
        });
        if (got <= 0) Fail(got < 0 ? errno : EIO);
        unread_.resize(static_cast<size_t>(got));
        read_ += static_cast<size_t>(got);
      }
    }
    const size_t part = std::min(count, unread_.size() - unread_at_);
    std::memcpy(to, unread_.data() + unread_at_, part);
    unread_at_ += part;
    to += part;
    count -= part;
  }
}

bool CandidateList::Take(Record& record) {
  const std::lock_guard lock(mutex_);
  if (unread_at_ == unread_.size() && read_ == written_ && unwritten_.empty()) return false;
  std::uint32_t length = 0;
  Read(reinterpret_cast<char*>(&length), sizeof(length));
  Read(reinterpret_cast<char*>(&record.location), sizeof(record.location));
  record.bytes.resize(length - sizeof(record.location));
  Read(record.bytes.data(), record.bytes.size());
  const std::string_view bytes = record.bytes;
  record.folder_path = bytes.substr(0, bytes.find('\0'));
  record.names = bytes.substr(record.folder_path.size() + 1);
  return true;
}

}  // namespace nas
