#include "nas/search/fleet_search.h"

#include <algorithm>
#include <cerrno>
#include <utility>

#include "nas/base/deadline.h"
#include "nas/base/json_text.h"
#include "nas/results/foreign_accounts.h"
#include "platform/task_record.h"

namespace nas {
namespace {

// That a box may wait for rows before it answers. Bounds how late rows are, and how often a box
// that has none is asked.
constexpr int kWaitMs = 250;
// All pages of all boxes that may be under way at once, as far as their rows are ordinary ones.
constexpr unsigned kMostRowsUnderWay = 50'000;
constexpr unsigned kFewestRows = 100;
// More than a box sends (kMostFleetPageBytes); taken apart, a page may take fifty times as much.
constexpr size_t kMostPageBytes = size_t{512} << 10;
// Of one box; rows name their share in 16 bits.
constexpr size_t kMostShares = 1000;
constexpr std::uint16_t kNoShare = 0xFFFF;
// The part of the deadline that the first page's rows wait for each other; those of a box that is
// slower join later.
constexpr int kFirstPageShare = 4;
// For boxes to be told that a search was stopped; those that do not hear it end it by its lease.
constexpr int kEndMs = 50;

unsigned PageLimit(size_t boxes) {
  const auto share = kMostRowsUnderWay / static_cast<unsigned>(std::max<size_t>(boxes, 1));
  return std::clamp(share, kFewestRows, kMostFleetRows);
}

bool IsIn(const FleetRow& row, const FleetLocation& location) {
  return location.share.empty() ||
         (row.share == location.share && RowBlock::IsAtOrBelow(row.folder, location.path));
}

std::string LocationText(const FleetLocation& location) {
  return "/" + location.share + (location.path.empty() ? "" : "/" + location.path);
}

}  // namespace

std::optional<Result<FleetLocation>> FindFleetLocation(const std::string& text) {
  if (CurrentConfig().fleet.boxes.empty() || !text.starts_with('/') ||
      text.find('\0') != std::string::npos) {
    return std::nullopt;
  }
  std::vector<std::string> parts;
  for (size_t at = 0; at < text.size();) {
    const size_t end = std::min(text.find('/', at + 1), text.size());
    const std::string part = text.substr(at + 1, end - at - 1);
    at = end;
    if (!part.empty() && part != ".") parts.push_back(part);
  }
  const FleetBox* box = parts.empty() ? nullptr : FindFleetBox(parts.front());
  if (box == nullptr) return std::nullopt;
  if (std::ranges::find(parts, "..") != parts.end()) return Error{kErrorIllegal, EINVAL, text};
  FleetLocation location;
  location.box = box;
  if (parts.size() > 1) location.share = parts[1];
  for (size_t i = 2; i < parts.size(); ++i) {
    location.path += (location.path.empty() ? "" : "/") + parts[i];
  }
  return location;
}

FleetSearch::FleetSearch(std::vector<FleetLocation> locations, Settings settings,
                         SharedSearch& search)
    : locations_(std::move(locations)),
      settings_(std::move(settings)),
      search_(search),
      fleet_(CurrentConfig().fleet),
      order_wait_ms_(std::min(fleet_.first_page_ms, kMostFleetWaitMs)),
      next_id_(kFirstForeignId),
      next_share_(settings_.first_number) {
  for (const FleetLocation& location : locations_) {
    auto box = std::ranges::find(boxes_, location.box, &Box::box);
    if (box == boxes_.end()) {
      box = boxes_.emplace(boxes_.end());
      box->box = location.box;
    }
    box->locations.push_back(&location);
  }
  page_.limit = PageLimit(boxes_.size());
  page_.wait_ms = kWaitMs;
  first_.emplace(ExpectedFirstPage(), static_cast<unsigned>(boxes_.size()));
  if (!first_->wanted()) first_.reset();
}

void FleetSearch::Run() {
  asker_.emplace(fleet_, kMostPageBytes);
  for (Box& box : boxes_) AskFirst(box);
  first_page_due_.emplace(fleet_.deadline_ms / kFirstPageShare);
  asker_->Run([this] {
    if (first_ && first_page_due_->passed()) ReleaseFirstPage();
    return search_.stopping();
  });
  if (first_) ReleaseFirstPage();
  search_.sink.Append(block_);
  if (search_.stopping()) EndSearches();
}

// Most boxes are asked the same.
const std::string& FleetSearch::QuestionFor(const Box& box) {
  std::vector<std::string> locations;
  for (const FleetLocation* location : box.locations) locations.push_back(LocationText(*location));
  if (!question_.empty() && locations == question_locations_) return question_;
  FleetQuestion question;
  question.query = search_.criteria.root;
  question.contents = settings_.contents;
  question.recursive = settings_.recursive;
  question.page = first_ ? first_->FirstRequest(order_wait_ms_) : page_;
  question.locations = question_locations_ = std::move(locations);
  return question_ = FleetQuestionText(question);
}

void FleetSearch::AskFirst(Box& box) {
  box.in_order = first_.has_value();
  asker_->Ask(*box.box,
              {"POST", "/fleet/search", QuestionFor(box), box.in_order ? order_wait_ms_ : kWaitMs},
              [this, &box](BoxAnswer answer) { Took(box, std::move(answer)); });
}

void FleetSearch::Took(Box& box, BoxAnswer answer) {
  if (answer.state != BoxState::kAnswered) {
    const bool lost = answer.state == BoxState::kOld && !box.task.empty();
    lost ? Finish(box, BoxState::kDown, "has lost the search")
         : Finish(box, answer.state, answer.why);
  } else {
    const auto page = ReadFleetPage(answer.body);
    if (page && TakePage(box, *page)) {
      TookPage(box, *page);
    } else if (!page && page.error().error_number == EPROTONOSUPPORT) {
      Finish(box, BoxState::kOld, "speaks another version's language");
    } else {
      Finish(box, BoxState::kDown, "says what is no answer");
    }
  }
  if (first_) LookAtFirstPage();
}

// Goes on with a box that has told a page.
void FleetSearch::TookPage(Box& box, const FleetPage& page) {
  // At once: a page that somebody looks at waits for it.
  search_.sink.Append(block_);
  if (page.finished && page.next == page.total) {
    if (page.error == kErrorNone) return Finish(box, BoxState::kAnswered, "");
    const bool folder = page.error == kErrorNoSuchFolder || page.error == kErrorPermission;
    return Finish(box, BoxState::kRefused, folder ? "no such folder" : "the search failed there");
  }
  if (page.next >= static_cast<std::uint64_t>(fleet_.rows_per_box)) {
    asker_->Ask(*box.box, {"POST", "/fleet/end", "{\"taskid\":\"" + box.task + "\"}"},
                [](const BoxAnswer&) {});
    return Finish(box, BoxState::kRefused, "has more rows than are asked for");
  }
  if (first_) {
    box.waits = true;
  } else {
    AskMore(box);
  }
}

bool FleetSearch::TakePage(Box& box, const FleetPage& page) {
  const unsigned limit = std::max(page_.limit, first_ ? first_->most_rows() : 0);
  const bool agrees = page.next >= box.next && page.total >= page.next &&
                      page.rows.size() <= limit &&
                      page.rows.size() <= (box.in_order ? page.total : page.next - box.next);
  if (!agrees) return false;
  // All of them before any is taken.
  std::vector<const FleetRow*> fresh;
  for (const FleetRow& row : page.rows) {
    const bool known = box.told_once.contains(row.number);
    if (!CanTake(box, row) || !TakeNumber(box, page, row)) return false;
    if (!known) fresh.push_back(&row);
  }
  for (const FleetRow* row : fresh) {
    if (!first_) {
      TakeRow(box, *row);
      continue;
    }
    first_->Add(BoxPlace(box), box.box->name + "/" + row->share, *row);
    held_.push_back({&box, *row});
  }
  // Of one that still searches, nobody knows which rows are the first.
  if (first_) first_->Told(BoxPlace(box), page.finished && page.next < page.total);
  search_.progress.AddMatches(fresh.size());
  box.told_any = box.told_any || !fresh.empty();
  box.task = page.task;
  box.next = page.next;
  return true;
}

// Whether the row's number can be that of this row: no row comes twice.
bool FleetSearch::TakeNumber(Box& box, const FleetPage& page, const FleetRow& row) {
  if (row.number >= page.total) return false;
  if (box.in_order) return box.told_once.insert(row.number).second;
  const bool follows = row.number >= box.lowest && row.number < page.next;
  box.lowest = std::uint64_t{row.number} + 1;
  return follows;
}

// Whether it lies in what was asked for. Its share has a number then.
bool FleetSearch::CanTake(Box& box, const FleetRow& row) {
  const bool asked_for = std::ranges::any_of(
      box.locations, [&row](const FleetLocation* asked) { return IsIn(row, *asked); });
  if (!asked_for || box.shares.contains(row.share)) return asked_for;
  if (box.shares.size() >= kMostShares || next_share_ == kNoShare) return false;
  settings_.add_share(next_share_, box.box->name + "/" + row.share);
  box.shares[row.share] = next_share_++;
  return true;
}

void FleetSearch::TakeRow(const Box& box, const FleetRow& row) {
  FileAttributes attributes = row.attributes;
  attributes.uid = IdOf(row.user, true);
  attributes.gid = IdOf(row.group, false);
  if (block_.full()) search_.sink.Append(block_);
  block_.SetFolder(box.shares.at(row.share), row.folder);
  block_.Add(row.name, attributes);
}

// Once every box has told what it was asked for, or will tell nothing.
void FleetSearch::LookAtFirstPage() {
  const bool all = std::ranges::all_of(
      boxes_, [](const Box& box) { return box.waits || box.state != BoxState::kAsked; });
  if (!all) return;
  bool whole = true;
  for (const size_t place : first_->AskFurther()) {
    Box& box = boxes_[place];
    if (!box.waits) continue;
    whole = box.waits = false;
    AskRows(box, first_->FurtherRequest(place, order_wait_ms_));
  }
  if (whole) ReleaseFirstPage();
}

// Its rows become visible, and all others are asked for.
void FleetSearch::ReleaseFirstPage() {
  first_.reset();
  for (const HeldRow& held : held_) TakeRow(*held.box, held.row);
  held_ = {};
  search_.sink.Append(block_);
  for (Box& box : boxes_) {
    if (box.waits) AskMore(box);
  }
}

void FleetSearch::AskRows(Box& box, const FleetPageRequest& page) {
  FleetPageRequest asked = page;
  asked.after = box.next;
  Json::Value body = FleetPageRequestJson(asked);
  body["task"] = box.task;
  box.in_order = page.column != SortColumn::kFound;
  asker_->Ask(*box.box, {"POST", "/fleet/rows", JsonText(body, JsonBytes::kRaw), page.wait_ms},
              [this, &box](BoxAnswer answer) { Took(box, std::move(answer)); });
}

void FleetSearch::AskMore(Box& box) {
  box.waits = false;
  AskRows(box, page_);
}

void FleetSearch::EndSearches() {
  for (Box& box : boxes_) {
    if (box.state != BoxState::kAsked || box.task.empty()) continue;
    asker_->Ask(*box.box, {"POST", "/fleet/end", "{\"taskid\":\"" + box.task + "\"}"},
                [](const BoxAnswer&) {});
  }
  const Deadline end(kEndMs);
  asker_->Run([&end] { return end.passed(); });
}

void FleetSearch::Finish(Box& box, BoxState state, const std::string& why) {
  const std::lock_guard lock(mutex_);
  box.state = state;
  box.why = why;
}

// Of an account that both machines have, this one's number, so that a listing can be narrowed down
// by it.
std::uint32_t FleetSearch::IdOf(const std::string& name, bool user) {
  const auto [known, added] = ids_.try_emplace({user, name});
  if (!added) return known->second;
  if (user) {
    if (const auto account = FindAccount(name)) return known->second = account->uid;
  } else if (const auto group = FindGroup(name)) {
    return known->second = group->gid;
  }
  settings_.add_account(next_id_, name);
  return known->second = next_id_++;
}

bool FleetSearch::failed() const {
  const std::lock_guard lock(mutex_);
  return std::ranges::none_of(
      boxes_, [](const Box& box) { return box.state == BoxState::kAnswered || box.told_any; });
}

void FleetSearch::Tell(Json::Value* walk) const {
  const std::lock_guard lock(mutex_);
  Json::Value& fleet = (*walk)[task_record::kFleet];
  fleet["total"] = Json::UInt64{boxes_.size()};
  std::map<BoxState, unsigned> counts;
  Json::Value troubles(Json::arrayValue);
  for (const Box& box : boxes_) {
    ++counts[box.state];
    if (box.state == BoxState::kAsked || box.state == BoxState::kAnswered) continue;
    Json::Value& trouble = troubles.append(Json::objectValue);
    trouble["name"] = box.box->name;
    trouble["state"] = BoxStateName(box.state);
    trouble["why"] = box.why;
  }
  for (const BoxState state : {BoxState::kAnswered, BoxState::kLate, BoxState::kDown,
                               BoxState::kRefused, BoxState::kOld}) {
    fleet[BoxStateName(state)] = counts[state];
  }
  fleet["boxes"].swap(troubles);
}

}  // namespace nas
