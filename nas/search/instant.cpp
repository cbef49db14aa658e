#include "nas/search/instant.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <tuple>
#include <utility>

#include "nas/index/frames.h"
#include "nas/match/folded_name.h"
#include "nas/search/index_best.h"
#include "nas/search/index_question.h"
#include "nas/search/instant_rank.h"
#include "nas/search/mounts_below.h"
#include "nas/search/row_frame.h"

namespace nas {
namespace {

using Kind = QueryNode::Kind;

constexpr int kTickMilliseconds = 5;
// In ticks, for a frame; beyond it nobody thinks of it as instant.
constexpr int kMostTicks = 100;

void AddRows(const RowBlock& block, size_t location, InstantReply& reply) {
  std::string_view attributes = block.attributes();
  block.EachFolder([&](std::string_view folder, std::string_view names) {
    while (!names.empty()) {
      reply.rows.push_back({location, std::string(folder), {}, {}});
      InstantReply::Row& row = reply.rows.back();
      row.name = names.substr(0, names.find('\0'));
      names.remove_prefix(row.name.size() + 1);
      std::memcpy(&row.attributes, attributes.data(), sizeof(row.attributes));
      attributes.remove_prefix(sizeof(row.attributes));
    }
  });
}

// The state in which the location's answer ended.
std::string TakeAnswer(int connection, const Location& location, size_t number,
                       const std::function<bool()>& cancelled, InstantReply& reply) {
  FrameReader reader(connection, kMaxAnswerBytes);
  Frame frame;
  RowBlock block;
  for (int ticks = 0; ticks < kMostTicks && !(cancelled && cancelled());) {
    const FrameReader::State state = reader.Read(kTickMilliseconds, &frame);
    if (state == FrameReader::State::kNotYet) {
      ++ticks;
      continue;
    }
    if (state != FrameReader::State::kFrame) break;
    if (frame.type == FrameType::kStatus) return frame.payload;
    if (frame.type == FrameType::kRows) {
      if (!ReadRowFrame(frame.payload, 0, location.path, block)) break;
      AddRows(block, number, reply);
    } else if (frame.type == FrameType::kEnd) {
      BestCount count;
      if (frame.payload.size() != sizeof(count)) break;
      std::memcpy(&count, frame.payload.data(), sizeof(count));
      reply.found += count.further;
      reply.more |= count.more;
      return std::string(kIndexCurrent);
    }
  }
  return "answer broken off";
}

int DepthBelow(const Location& location, const std::string& folder) {
  const std::string_view below =
      std::string_view(folder).substr(std::min(folder.size(), location.path.size()));
  return 1 + static_cast<int>(std::ranges::count(below, '/')) +
         (location.path.empty() && !below.empty() ? 1 : 0);
}

// The same order for all, by what was looked up.
void PutBestFirst(const std::vector<Location>& locations, const QueryNode& query, size_t most,
                  InstantReply& reply) {
  const InstantRanking ranking(query);
  std::vector<std::tuple<InstantRank, size_t>> order;
  for (size_t i = 0; i < reply.rows.size(); ++i) {
    const InstantReply::Row& row = reply.rows[i];
    order.emplace_back(
        ranking.Rank(FoldText(row.name), DepthBelow(locations[row.location], row.folder),
                     row.attributes.mtime),
        i);
  }
  std::ranges::sort(order);
  std::vector<InstantReply::Row> rows;
  for (size_t i = 0; i < order.size() && i < most; ++i) {
    rows.push_back(std::move(reply.rows[std::get<1>(order[i])]));
  }
  reply.found += reply.rows.size();
  reply.rows = std::move(rows);
}

}  // namespace

Result<InstantReply> AskInstantly(
    const std::vector<Location>& locations, const QueryNode& query, bool recursive, size_t most,
    const std::function<bool()>& cancelled,
    const std::function<IndexAnswer(int location, bool asks_times)>& ask) {
  if (AnyLeaf(query, [](const QueryNode& leaf) { return leaf.kind == Kind::kContent; })) {
    return Error{kErrorIllegal, EINVAL, "contents are not looked into"};
  }
  InstantReply reply;
  reply.state = kIndexCurrent;
  for (size_t i = 0; i < locations.size(); ++i) {
    const Location& location = locations[i];
    const auto mounts = MountsBelow(location.fd.get());
    const std::string question =
        QuestionText({.query = query,
                      .share = location.share,
                      .path = location.path,
                      .mounts = mounts ? *mounts : std::vector<std::string>(),
                      .rules = FolderGate::RulesFor(locations, recursive),
                      .best = std::min(most, kMostBest)});
    const IndexAnswer answer = ask(location.fd.get(), AsksTimes(query));
    std::string state = answer.state;
    if (answer.connection) {
      const bool sent = SendFrame(answer.connection.get(), FrameType::kQuestion, question).ok();
      state = sent ? TakeAnswer(answer.connection.get(), location, i, cancelled, reply)
                   : "answer broken off";
    }
    if (state != kIndexCurrent && reply.state == kIndexCurrent) reply.state = state;
  }
  PutBestFirst(locations, query, most, reply);
  return reply;
}

Json::Value InstantJson(const InstantReply& reply, const std::vector<Location>& locations) {
  Json::Value json;
  json["index"] = reply.state;
  json["found"] = Json::UInt64{reply.found};
  json["more"] = reply.more;
  json["rows"] = Json::arrayValue;
  for (const InstantReply::Row& row : reply.rows) {
    Json::Value& one = json["rows"].append(Json::objectValue);
    const std::string folder = row.folder.empty() ? "" : row.folder + "/";
    one["path"] = "/" + locations[row.location].share.name + "/" + folder + row.name;
    one["name"] = row.name;
    one["is_dir"] = S_ISDIR(row.attributes.mode);
    one["size"] = Json::UInt64{row.attributes.size};
    one["mtime"] = Json::Int64{row.attributes.mtime};
  }
  return json;
}

}  // namespace nas
