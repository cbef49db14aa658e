#pragma once
// What a walk has seen so far, as clients are told: the task property "walk" of
// platform/task_record.h.

#include <json/value.h>

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/task_record.h"

namespace nas {

class WalkProgress {
 public:
  enum class Phase { kNames, kContents, kDone };

  // Counted by the threads of the walk, one call a folder or a match.
  void AddFolder(std::uint64_t entries) {
    folders_.fetch_add(1, std::memory_order_relaxed);
    entries_.fetch_add(entries, std::memory_order_relaxed);
  }
  void AddMatches(std::uint64_t count) { matches_.fetch_add(count, std::memory_order_relaxed); }
  void AddMatch() { matches_.fetch_add(1, std::memory_order_relaxed); }
  std::uint64_t matches() const { return matches_.load(std::memory_order_relaxed); }
  // A folder could not be read; `error_number` says why.
  void AddSkipped(int error_number) {
    if (error_number == EACCES || error_number == EPERM) {
      permission_.fetch_add(1, std::memory_order_relaxed);
    } else if (HasVanished(error_number)) {
      vanished_.fetch_add(1, std::memory_order_relaxed);
    } else {
      other_.fetch_add(1, std::memory_order_relaxed);
    }
  }
  // The same of a file, or of what is known of it.
  void AddUnreadableFile(int error_number) {
    auto& count = HasVanished(error_number) ? vanished_ : unreadable_files_;
    count.fetch_add(1, std::memory_order_relaxed);
  }
  // A file's contents were not looked into, because they are no text.
  void AddNotText() { not_text_.fetch_add(1, std::memory_order_relaxed); }
  // Files whose contents are to be read, and one of them that is read now.
  void AddCandidates(std::uint64_t count) {
    candidates_.fetch_add(count, std::memory_order_relaxed);
  }
  void BeginContents(std::string_view folder, std::string_view name) {
    content_files_.fetch_add(1, std::memory_order_relaxed);
    const std::lock_guard lock(reading_mutex_);
    reading_.assign(folder).append(folder.empty() ? "" : "/").append(name);
  }
  std::atomic<std::uint64_t>& content_bytes() { return content_bytes_; }
  // A folder that is never searched.
  void AddLeftOut() { left_out_.fetch_add(1, std::memory_order_relaxed); }
  void SetPhase(Phase phase) { phase_ = phase; }

  // What another process has seen and counts for this one, all but matches.
  struct Counts {
    std::uint64_t folders = 0;
    std::uint64_t entries = 0;
    std::uint64_t permission = 0;
    std::uint64_t vanished = 0;
    std::uint64_t other = 0;
    std::uint64_t unreadable_files = 0;
    std::uint64_t not_text = 0;
  };
  Counts counts() const {
    return {folders_, entries_, permission_, vanished_, other_, unreadable_files_, not_text_};
  }
  // Counts the newer in the place of the older, which were counted before.
  void Replace(const Counts& older, const Counts& newer) {
    folders_ += newer.folders - older.folders;
    entries_ += newer.entries - older.entries;
    permission_ += newer.permission - older.permission;
    vanished_ += newer.vanished - older.vanished;
    other_ += newer.other - older.other;
    unreadable_files_ += newer.unreadable_files - older.unreadable_files;
    not_text_ += newer.not_text - older.not_text;
  }

  std::uint64_t folders() const { return folders_; }
  std::uint64_t entries() const { return entries_; }
  std::uint64_t left_out() const { return left_out_; }

  Json::Value ToJson() const {
    namespace record = task_record;
    constexpr const char* kPhases[] = {record::kNamesPhase, record::kContentsPhase,
                                       record::kDonePhase};
    Json::Value json;
    json[record::kPhase] = kPhases[static_cast<int>(phase_.load())];
    json[record::kFolders] = Json::UInt64{folders_};
    json[record::kEntries] = Json::UInt64{entries_};
    json[record::kMatches] = Json::UInt64{matches_};
    json[record::kSkipped][record::kPermission] = Json::UInt64{permission_};
    json[record::kSkipped][record::kVanished] = Json::UInt64{vanished_};
    json[record::kSkipped][record::kOther] = Json::UInt64{other_};
    json[record::kFiles][record::kUnreadable] = Json::UInt64{unreadable_files_};
    json[record::kFiles][record::kNotText] = Json::UInt64{not_text_};
    if (phase_ != Phase::kContents) return json;
    Json::Value& reading = json[record::kReading];
    reading[record::kFiles] = Json::UInt64{content_files_};
    reading[record::kOf] = Json::UInt64{candidates_};
    reading[record::kBytes] = Json::UInt64{content_bytes_};
    const std::lock_guard lock(reading_mutex_);
    reading[record::kPath] = reading_;
    return json;
  }

 private:
  static bool HasVanished(int error_number) {
    return error_number == ENOENT || error_number == ENOTDIR;
  }

  std::atomic<Phase> phase_ = Phase::kNames;
  std::atomic<std::uint64_t> folders_ = 0;
  std::atomic<std::uint64_t> entries_ = 0;
  std::atomic<std::uint64_t> matches_ = 0;
  std::atomic<std::uint64_t> permission_ = 0;
  std::atomic<std::uint64_t> vanished_ = 0;
  std::atomic<std::uint64_t> other_ = 0;
  std::atomic<std::uint64_t> unreadable_files_ = 0;
  std::atomic<std::uint64_t> not_text_ = 0;
  std::atomic<std::uint64_t> left_out_ = 0;
  std::atomic<std::uint64_t> candidates_ = 0;
  std::atomic<std::uint64_t> content_files_ = 0;
  std::atomic<std::uint64_t> content_bytes_ = 0;
  mutable std::mutex reading_mutex_;  // guards reading_
  std::string reading_;               // below the share's root
};

}  // namespace nas
