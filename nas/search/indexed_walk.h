#pragma once
// The names of a search's locations, from the index where that answers and from a walk elsewhere:
// of locations that it does not answer for, of what is mounted below others, and where an answer
// breaks off. The rows are the same either way, but for how soon they come.

#include <json/value.h>

#include <atomic>
#include <cstdint>
#include <functional>
#include <mutex>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "nas/index/client.h"
#include "nas/index/frames.h"
#include "nas/search/folder_walk.h"
#include "nas/search/index_question.h"
#include "nas/search/location.h"
#include "nas/search/name_source.h"
#include "nas/system/config.h"

namespace nas {

class IndexedWalk : public NameSource {
 public:
  struct Settings {
    bool recursive = true;
    bool texts_too = false;  // contents can stand in for names
    IndexUse use = IndexUse::kAuto;
    std::string temporary_folder = {};
    // Who asks the index, for tests.
    std::function<IndexAnswer(int location, bool asks_times)> ask = AskIndex;
  };
  // Both are borrowed. A location given twice is searched once.
  IndexedWalk(const std::vector<Location>& locations, Settings settings, SharedSearch& search);

  // With IndexUse::kAlways it throws std::runtime_error where it would have to walk.
  void Feed(size_t thread, Judge& judge) override;
  void Abort() override { walk_.Abort(); }

  // Adds to the task property "walk" how the search is answered, once that is known. Callable from
  // any thread.
  void Tell(Json::Value* walk) const;

 private:
  struct Receiving;  // one answer, as far as it has come

  void Search(size_t thread, std::uint16_t number);
  // Whether the answer came whole; otherwise `why` not.
  bool TakeAnswer(std::uint16_t number, const std::vector<std::string>& mounts, std::string* why);
  bool TakeFrame(const Frame& frame, Receiving& receiving);
  bool TakeRows(std::string_view payload, Receiving& receiving);
  bool TakeUnread(std::string_view payload, Receiving& receiving) const;
  bool TakeCandidates(std::string_view payload, Receiving& receiving);
  void GiveUp(Receiving& receiving);
  bool WalkMounts(size_t thread, std::uint16_t number, const std::vector<std::string>& mounts);
  void WalkInstead(size_t thread, std::uint16_t number, const std::string& why);
  std::string QuestionAbout(const Location& location, const std::vector<std::string>& mounts) const;

  const std::vector<Location>& locations_;
  const Settings settings_;
  SharedSearch& search_;
  const FolderGate gate_;
  const FolderGate gate_to_mounts_;
  const bool asks_times_;
  FolderWalk walk_;
  std::vector<std::uint16_t> numbers_;  // of the locations to search
  std::atomic<size_t> next_ = 0;
  std::atomic<size_t> done_ = 0;

  mutable std::mutex mutex_;  // guards everything below
  bool from_index_ = false;
  bool from_walk_ = false;
  std::string why_walked_;  // the first time
};

}  // namespace nas
