#include "nas/search/indexed_walk.h"

#include <fcntl.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <optional>
#include <stdexcept>
#include <utility>

#include "nas/search/mounts_below.h"
#include "nas/search/row_frame.h"
#include "platform/task_record.h"

namespace nas {
namespace {

// How often the stop flag is looked at while nothing comes.
constexpr int kTickMilliseconds = 25;
// For the next frame: a child tells its counts far more often.
constexpr int kPatienceMilliseconds = 10'000;

FolderGate::Rules OnOneMount(FolderGate::Rules rules) {
  rules.crosses_mounts = false;
  return rules;
}

// Cuts the first NUL-ended text off; nothing where there is none.
std::optional<std::string_view> TakeText(std::string_view* bytes) {
  const size_t end = bytes->find('\0');
  if (end == std::string_view::npos) return std::nullopt;
  const std::string_view text = bytes->substr(0, end);
  bytes->remove_prefix(end + 1);
  return text;
}

}  // namespace

struct IndexedWalk::Receiving {
  const std::uint16_t number;
  WalkProgress::Counts counts = {};
  RowBlock block = {};
  std::uint64_t rows = 0;
  // What has been told, should the answer break off. Made with the first of it.
  std::unique_ptr<CandidateList> told = nullptr;
  UnreadFolders unread = {};  // told once the answer is whole
  bool ended = false;
  std::string status = {};
};

IndexedWalk::IndexedWalk(const std::vector<Location>& locations, Settings settings,
                         SharedSearch& search)
    : locations_(locations),
      settings_(std::move(settings)),
      search_(search),
      gate_(locations, settings_.recursive, search.criteria.pruning),
      gate_to_mounts_(OnOneMount(gate_.rules()), search.criteria.pruning),
      asks_times_(AsksTimes(search.criteria.root)),
      walk_(locations, gate_, search) {
  std::set<std::pair<dev_t, ino_t>> known;
  for (size_t i = 0; i < locations.size(); ++i) {
    const bool added = known.emplace(locations[i].device, locations[i].inode).second;
    if (added) numbers_.push_back(static_cast<std::uint16_t>(i));
  }
  walk_.Hold();
}

void IndexedWalk::Feed(size_t thread, Judge& judge) {
  while (!search_.stopping()) {
    const size_t next = next_++;
    if (next >= numbers_.size()) break;
    Search(thread, numbers_[next]);
    if (++done_ == numbers_.size()) walk_.Release();
  }
  if (search_.stopping()) walk_.Abort();
  walk_.Feed(thread, judge);
}

void IndexedWalk::Search(size_t thread, std::uint16_t number) {
  if (settings_.use == IndexUse::kNever) return WalkInstead(thread, number, "not asked");
  const auto mounts = MountsBelow(locations_[number].fd.get());
  if (!mounts) return WalkInstead(thread, number, "place unknown");
  std::string why;
  if (!TakeAnswer(number, *mounts, &why)) {
    if (!search_.stopping()) WalkInstead(thread, number, why);
    return;
  }
  const bool mounted = settings_.recursive && WalkMounts(thread, number, *mounts);
  const std::lock_guard lock(mutex_);
  from_index_ = true;
  from_walk_ |= mounted;
  if (mounted && why_walked_.empty()) why_walked_ = "mounted folders";
}

void IndexedWalk::WalkInstead(size_t thread, std::uint16_t number, const std::string& why) {
  {
    const std::lock_guard lock(mutex_);
    from_walk_ = true;
    if (why_walked_.empty()) why_walked_ = why;
  }
  if (settings_.use == IndexUse::kAlways) {
    throw std::runtime_error("not answered by the index: " + why);
  }
  walk_.Begin(thread, number);
}

std::string IndexedWalk::QuestionAbout(const Location& location,
                                       const std::vector<std::string>& mounts) const {
  return QuestionText({.query = search_.criteria.root,
                       .texts_too = settings_.texts_too,
                       .unread = search_.unread != nullptr,
                       .names_alone = search_.names_alone,
                       .share = location.share,
                       .path = location.path,
                       .mounts = mounts,
                       .rules = gate_.rules()});
}

bool IndexedWalk::TakeAnswer(std::uint16_t number, const std::vector<std::string>& mounts,
                             std::string* why) {
  const Location& location = locations_[number];
  const std::string question = QuestionAbout(location, mounts);
  *why = "question too long";
  if (question.size() > kMaxQuestionBytes) return false;
  const IndexAnswer answer = settings_.ask(location.fd.get(), asks_times_);
  *why = answer.state;
  if (!answer.connection) return false;
  *why = "answer broken off";
  if (!SendFrame(answer.connection.get(), FrameType::kQuestion, question)) return false;
  FrameReader reader(answer.connection.get(), kMaxAnswerBytes);
  Receiving receiving{number};
  Frame frame;
  for (int waited = 0; waited < kPatienceMilliseconds && !search_.stopping();) {
    const FrameReader::State state = reader.Read(kTickMilliseconds, &frame);
    if (state == FrameReader::State::kNotYet) {
      waited += kTickMilliseconds;
      continue;
    }
    waited = 0;
    if (state != FrameReader::State::kFrame || !TakeFrame(frame, receiving)) break;
    if (!receiving.ended) continue;
    for (const UnreadFolders::Folder& folder : receiving.unread.folders()) {
      search_.unread->AddUnread(folder.error_number, number, folder.path);
    }
    return true;
  }
  if (!receiving.status.empty()) *why = receiving.status;
  if (!search_.stopping()) GiveUp(receiving);
  return false;
}

// What was counted is counted again by the walk; what was told is not told again.
void IndexedWalk::GiveUp(Receiving& receiving) {
  search_.progress.Replace(receiving.counts, {});
  if (!receiving.told) return;
  CandidateList::Record record;
  while (receiving.told->Take(record)) {
    search_.told.Add(record.location, record.folder_path, record.names);
  }
}

// False where the connection is of no more use.
bool IndexedWalk::TakeFrame(const Frame& frame, Receiving& receiving) {
  switch (frame.type) {
    case FrameType::kRows:
      return TakeRows(frame.payload, receiving);
    case FrameType::kCandidates:
      return TakeCandidates(frame.payload, receiving);
    case FrameType::kProgress: {
      WalkProgress::Counts counts;
      if (frame.payload.size() != sizeof(counts)) return false;
      std::memcpy(&counts, frame.payload.data(), sizeof(counts));
      search_.progress.Replace(receiving.counts, counts);
      receiving.counts = counts;
      return true;
    }
    case FrameType::kUnread:
      return TakeUnread(frame.payload, receiving);
    case FrameType::kEnd:
      receiving.ended = true;
      return true;
    case FrameType::kStatus:
      receiving.status = frame.payload;
      return false;
    case FrameType::kQuestion:
      break;
  }
  return false;
}

bool IndexedWalk::TakeRows(std::string_view payload, Receiving& receiving) {
  RowBlock& block = receiving.block;
  if (!ReadRowFrame(payload, receiving.number, locations_[receiving.number].path, block)) {
    return false;
  }
  if (!receiving.told) {
    receiving.told = std::make_unique<CandidateList>(settings_.temporary_folder);
  }
  block.EachFolder([&](std::string_view folder, std::string_view its_names) {
    receiving.told->Add(receiving.number, folder, its_names);
  });
  search_.progress.AddMatches(block.size());
  search_.sink.Append(block);
  return true;
}

bool IndexedWalk::TakeUnread(std::string_view payload, Receiving& receiving) const {
  int error_number = 0;
  if (search_.unread == nullptr || payload.size() < sizeof(error_number)) return false;
  std::memcpy(&error_number, payload.data(), sizeof(error_number));
  payload.remove_prefix(sizeof(error_number));
  if (!RowBlock::IsAtOrBelow(payload, locations_[receiving.number].path)) return false;
  receiving.unread.AddUnread(error_number, receiving.number, payload);
  return true;
}

bool IndexedWalk::TakeCandidates(std::string_view payload, Receiving& receiving) {
  const auto folder = TakeText(&payload);
  if (!folder || search_.candidate_sink == nullptr) return false;
  const std::uint64_t count = RowBlock::CountNames(payload).value_or(0);
  if (!RowBlock::IsAtOrBelow(*folder, locations_[receiving.number].path) || count == 0) {
    return false;
  }
  search_.progress.AddCandidates(count);
  if (!receiving.told) {
    receiving.told = std::make_unique<CandidateList>(settings_.temporary_folder);
  }
  receiving.told->Add(receiving.number, *folder, payload);
  search_.candidate_sink->Add(receiving.number, *folder, payload);
  return true;
}

// Goes to each place as a walk does. Where the way ends at a place where something is mounted, that
// is walked with all below it; where it ends otherwise, a walk would not have come there either.
bool IndexedWalk::WalkMounts(size_t thread, std::uint16_t number,
                             const std::vector<std::string>& mounts) {
  const Location& location = locations_[number];
  std::set<std::string> walked;
  for (std::string_view rest : mounts) {
    std::string path = location.path;
    IgnoreFiles::Ptr ignores = gate_.IgnoresAbove(location);
    FolderGate::Opened folder = gate_to_mounts_.Open(location.fd.get(), ".");
    while (folder.fd && !rest.empty()) {
      const std::string name(rest.substr(0, rest.find('/')));
      rest.remove_prefix(std::min(name.size() + 1, rest.size()));
      ignores = gate_.IgnoresOf(folder.fd.get(), path, ignores);
      if (gate_.Below(DT_DIR, location, path, name, ignores.get()) != Refusal::kNone) break;
      FolderGate::Opened below = gate_to_mounts_.Open(folder.fd.get(), name.c_str());
      const std::string below_path = path + (path.empty() ? "" : "/") + name;
      if (below.refusal == Refusal::kOtherMount && walked.insert(below_path).second) {
        walk_.Add(thread, number, std::move(folder.fd), path, name, ignores);
      }
      path = below_path;
      folder = std::move(below);
    }
  }
  return !walked.empty();
}

void IndexedWalk::Tell(Json::Value* walk) const {
  namespace record = task_record;
  const std::lock_guard lock(mutex_);
  if (!from_index_ && !from_walk_) return;
  const char* const one = from_index_ ? record::kFromIndex : record::kFromWalk;
  (*walk)[record::kSource] = from_index_ && from_walk_ ? record::kFromBoth : one;
  (*walk)[record::kIndex] = why_walked_.empty() ? std::string(kIndexCurrent) : why_walked_;
}

}  // namespace nas
