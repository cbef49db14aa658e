// Nothing is stored and no search runs: the index is asked, in this process and as the user, and
// answers or does not.

#include "arbory/find_command.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <optional>
#include <string>
#include <vector>

#include "arbory/caller.h"
#include "arbory/comparators.h"
#include "arbory/interrupt.h"
#include "arbory/locate.h"
#include "arbory/picker.h"
#include "arbory/rows.h"
#include "arbory/run_commands.h"
#include "arbory/search_request.h"
#include "arbory/search_text.h"
#include "arbory/terminal.h"
#include "nas/base/paths.h"
#include "nas/index/mounts.h"
#include "nas/search/criteria.h"
#include "nas/search/instant.h"
#include "nas/system/identity.h"
#include "nas/system/volumes.h"

namespace arbory {
namespace {

constexpr char kNoContents[] = "find does not look into contents; arbory search does";

struct Answer {
  std::vector<nas::Location> locations;
  nas::InstantReply reply;
};

// Every share and volume that the user can list, sorted. Each location is a question of its own, so
// what lies in another one on the same mount is left to that one.
std::vector<std::string> Everywhere(const std::vector<nas::Share>& shares, bool recursive) {
  std::vector<std::string> roots = nas::ListVolumes();
  for (const nas::Share& share : shares) roots.push_back(share.root.empty() ? "/" : share.root);
  for (std::string& root : roots) root = nas::RealPath(root).value_or("");
  std::ranges::sort(roots);
  std::vector<std::string> folders;
  std::vector<std::uint64_t> mounts;
  for (const std::string& root : roots) {
    const nas::UniqueFd folder(open(root.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const auto place = folder ? nas::PlaceOf(folder.get()) : std::nullopt;
    if (!place) continue;
    bool held = false;
    for (size_t i = 0; i < folders.size(); ++i) {
      held |= mounts[i] == place->mount_id &&
              (recursive ? nas::IsWithin(root, folders[i] == "/" ? "" : folders[i])
                         : root == folders[i]);
    }
    if (held) continue;
    folders.push_back(root);
    mounts.push_back(place->mount_id);
  }
  return folders;
}

// As PrepareSearch, for all folders there are where none is given.
Json::Value Prepare(const SearchQuery& query, const std::vector<nas::Share>& shares,
                    Caller* caller) {
  if (!query.folders.empty()) return PrepareSearch(query, caller);
  const std::vector<std::string> folders = Everywhere(shares, query.recursive);
  if (folders.empty()) throw UsageError("there is no share to look in; give a folder with --in");
  const Locations locations = LocateFolders(folders, shares, /*recursive=*/false);
  caller->AddShares(locations.added);
  return SearchRequest(query, locations.paths, std::time(nullptr));
}

// Nothing where it was interrupted.
std::optional<Answer> Ask(const Json::Value& params, bool recursive, size_t most) {
  Answer answer;
  for (const Json::Value& text : params["folder_path"]) {
    auto location = nas::OpenLocation(text.asString());
    if (location) {
      answer.locations.push_back(std::move(*location));
    } else {
      Complain("a folder cannot be searched: " + location.error().Text());
    }
  }
  if (answer.locations.empty()) throw UsageError("there is no folder left to look in");
  const Comparators comparators(params);
  const nas::Criteria criteria(comparators.get());
  auto reply = nas::AskInstantly(answer.locations, criteria.root, recursive, most, Interrupted);
  if (Interrupted()) return std::nullopt;
  if (!reply) throw UsageError(kNoContents);
  answer.reply = std::move(*reply);
  if (answer.reply.rows.empty() && answer.reply.state != nas::kIndexCurrent) {
    throw UsageError("the index gives no answer (" + answer.reply.state +
                     "); arbory search does without it");
  }
  return answer;
}

// The rows as a search prints them, each seen from its share though a volume may have been asked.
std::string RowsText(const Answer& answer, const std::vector<nas::Share>& shares,
                     const RowFormat& format) {
  RowWriter writer(format);
  std::string text;
  for (const nas::InstantReply::Row& row : answer.reply.rows) {
    nas::Share share = answer.locations[row.location].share;
    const std::string folder = share.root + (row.folder.empty() ? "" : "/" + row.folder);
    const nas::Share* inner = InnermostShare(folder, shares);
    if (inner != nullptr && inner->root.size() > share.root.size()) share = *inner;
    const std::string below = folder.substr(std::min(folder.size(), share.root.size() + 1));
    writer.Append({share.name, share.root, below, row.name, &row.attributes}, &text);
  }
  return text;
}

void TellOfMore(const nas::InstantReply& reply) {
  if (reply.state != nas::kIndexCurrent) {
    Complain("some folders are left out (" + reply.state + "); arbory search looks there too");
  }
  if (!reply.more && reply.found <= reply.rows.size()) return;
  const std::uint64_t shown = reply.rows.size();
  Complain("more than " + Counted(shown, "file matches", "match") + "; arbory search lists all");
}

int PrintRows(const std::string& text) {
  Print(text);
  if (Interrupted()) return kExitInterrupted;
  return text.empty() ? kExitNothing : kExitSuccess;
}

int RunFor(const OutputOptions& options, const std::string& paths) {
  CommandRunner commands(options);
  const bool ran = commands.Take(paths) && commands.Finish();
  if (Interrupted()) return kExitInterrupted;
  if (!ran && commands.failure() != 0 && commands.failure() != EPIPE) {
    throw std::runtime_error(CannotPrint(commands.failure()));
  }
  return ran && commands.all_succeeded() && !paths.empty() ? kExitSuccess : kExitNothing;
}

int Pick(const FindOptions& options, std::string choices) {
  std::vector<std::string> arguments = options.arguments;
  if (!arguments.empty() && arguments.back() == "--") arguments.pop_back();
  return RunPicker({.arguments = std::move(arguments),
                    .first = std::move(choices),
                    .end = options.output.null_separated ? '\0' : '\n'});
}

bool WantsPicker(const FindOptions& options) {
  const bool paths = !options.output.json && !options.output.long_format &&
                     options.output.format.empty() && !options.output.runs();
  // Standard output may be taken by another program: vi "$(arbory find)".
  return options.words.empty() && paths && !options.choices && isatty(STDIN_FILENO) != 0 &&
         isatty(STDERR_FILENO) != 0;
}

int Find(const FindOptions& options) {
  Caller caller(options.common);
  caller.BecomeUser();
  nas::GiveUpRoot();
  if (options.query.content) throw UsageError(kNoContents);
  const std::vector<nas::Share> shares = nas::ListShares();
  const Json::Value params = Prepare(options.query, shares, &caller);
  const auto answer = Ask(params, options.query.recursive, options.limit);
  if (!answer) return kExitInterrupted;
  const bool picks = WantsPicker(options);
  RowFormat format = FormatOf(options.output);
  if (picks || options.choices) format = {.kind = RowFormat::Kind::kChoice, .end = '\0'};
  std::string text = RowsText(*answer, shares, format);
  if (picks) return Pick(options, std::move(text));
  const int code = options.output.runs() ? RunFor(options.output, text) : PrintRows(text);
  TellOfMore(answer->reply);
  return code;
}

}  // namespace

int RunFindCommand(const FindOptions& options) {
  WatchForInterrupt();
  if (!options.choices) return Find(options);
  try {
    Find(options);
  } catch (const std::exception& error) {
    // Where standard error is not seen, among the choices, as one without a path.
    Print("\tarbory: " + Escaped(error.what()) + '\0');
  }
  return kExitSuccess;  // fzf would tell of a failed command
}

}  // namespace arbory
