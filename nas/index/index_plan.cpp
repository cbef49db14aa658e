#include "nas/index/index_plan.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/vfs.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <map>

#include "nas/base/hex.h"
#include "nas/base/json_text.h"
#include "nas/base/paths.h"
#include "nas/index/mounts.h"
#include "nas/system/config.h"
#include "nas/system/shares.h"
#include "nas/system/volumes.h"

namespace nas {
namespace {

// Of this machine alone, so that nothing changes without this kernel's doing.
constexpr std::array<const char*, 9> kLocalTypes = {"ext2", "ext3", "ext4",     "xfs",  "btrfs",
                                                    "f2fs", "jfs",  "bcachefs", "tmpfs"};
// What f_fsid of statfs(2) is made from the file system's own id by; others take the device's
// number.
constexpr std::array<const char*, 4> kOwnFsid = {"ext2", "ext3", "ext4", "btrfs"};
constexpr char kVolatile[] = "tmpfs";

template <size_t Count>
bool IsAmong(const std::array<const char*, Count>& types, const std::string& type) {
  return std::ranges::find(types, type) != types.end();
}

// FS_IOC_GETFSUUID, of Linux 6.9.
struct OwnId {
  unsigned char length = 0;
  std::array<unsigned char, 16> bytes = {};
};
constexpr unsigned long kGetOwnId = _IOR(0x15, 0, OwnId);

std::string Hex(const void* bytes, size_t length) {
  std::string text;
  for (size_t at = 0; at < length; ++at) {
    AppendHex(static_cast<const unsigned char*>(bytes)[at], kLowerHex, &text);
  }
  return text;
}

// Images are made without an id, and kernels hide it.
bool TellsNothing(const std::string& id) { return id.find_first_not_of('0') == id.npos; }

// The file system's own id, the same wherever and whenever it is mounted. Empty for none.
std::string IdOf(int folder, const std::string& type) {
  OwnId own;
  struct statfs status;
  std::string id;
  if (ioctl(folder, kGetOwnId, &own) == 0 && own.length <= own.bytes.size()) {
    id = Hex(own.bytes.data(), own.length);
  }
  if (TellsNothing(id) && IsAmong(kOwnFsid, type) && fstatfs(folder, &status) == 0) {
    id = Hex(&status.f_fsid, sizeof status.f_fsid);
  }
  return TellsNothing(id) ? std::string() : id;
}

std::vector<std::string> WantedFolders() {
  std::vector<std::string> folders;
  for (const std::string& wanted : CurrentConfig().index.folders) {
    if (wanted.starts_with('/')) {
      folders.push_back(RealPath(wanted).value_or(wanted));
    } else if (const auto share = FindShare(wanted)) {
      folders.push_back(share->root.empty() ? "/" : share->root);
    }
  }
  if (!folders.empty() || !CurrentConfig().index.folders.empty()) return folders;
  for (const Share& share : ListShares()) folders.push_back(share.root.empty() ? "/" : share.root);
  for (const std::string& volume : ListVolumes()) {
    folders.push_back(RealPath(volume).value_or(volume));
  }
  return folders;
}

class Planner {
 public:
  void Add(const std::string& path) {
    const UniqueFd folder(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const auto place = folder ? PlaceOf(folder.get()) : std::nullopt;
    if (!place) return LeaveOut(path, "it cannot be opened");
    const auto mount = FindMount(place->mount_id);
    if (!mount) return LeaveOut(path, "its mount is not found");
    if (!IsAmong(kLocalTypes, mount->type)) {
      return LeaveOut(path, mount->type + " does not tell of all changes");
    }
    FileSystem& found = by_device_[mount->device];
    if (found.trees.empty()) {
      const std::string id = IdOf(folder.get(), mount->type);
      found.keeps = !id.empty() && mount->type != kVolatile;
      found.id = id.empty() ? "device-" + mount->device : id;
      found.type = mount->type;
      found.source = mount->source;
      found.device = mount->device;
    }
    if (std::ranges::find(found.numbers, place->number) == found.numbers.end()) {
      found.numbers.push_back(place->number);
    }
    // Paths come sorted, so one that holds others comes before them; but not what is mounted there.
    const auto holds = [&](const auto& tree) {
      return tree.second == place->mount_id && IsWithin(path, tree.first);
    };
    if (std::ranges::any_of(mounts_of_trees_, holds)) return;
    mounts_of_trees_.emplace_back(path, place->mount_id);
    found.trees.push_back(path);
  }

  Plan Take() {
    std::map<std::string, int> with_id;
    for (const auto& [device, found] : by_device_) ++with_id[found.id];
    for (auto& [device, found] : by_device_) {
      // Copies of one file system, as a volume's snapshot is: nobody can tell later which was
      // which.
      if (with_id[found.id] > 1) {
        found.id += "-" + device;
        found.keeps = false;
      }
      plan_.file_systems.push_back(std::move(found));
    }
    std::ranges::sort(plan_.file_systems, {}, &FileSystem::id);
    return std::move(plan_);
  }

 private:
  void LeaveOut(const std::string& tree, const std::string& why) {
    plan_.left_out.push_back({tree, why});
  }

  std::map<std::string, FileSystem> by_device_;
  std::vector<std::pair<std::string, std::uint64_t>> mounts_of_trees_;
  Plan plan_;
};

Json::Value ListOf(const std::vector<std::string>& texts) {
  Json::Value list(Json::arrayValue);
  for (const std::string& text : texts) list.append(text);
  return list;
}

std::vector<std::string> TextsOf(const Json::Value& list) {
  std::vector<std::string> texts;
  for (const Json::Value& item : list) texts.push_back(item.asString());
  return texts;
}

}  // namespace

Plan MakePlan() {
  std::vector<std::string> folders = WantedFolders();
  std::ranges::sort(folders);
  folders.erase(std::unique(folders.begin(), folders.end()), folders.end());
  Planner planner;
  for (const std::string& folder : folders) planner.Add(folder);
  return planner.Take();
}

std::string PlanText(const Plan& plan) {
  Json::Value text;
  text["file_systems"] = Json::arrayValue;
  text["left_out"] = Json::arrayValue;
  for (const FileSystem& found : plan.file_systems) {
    Json::Value item;
    item["id"] = found.id;
    item["keeps"] = found.keeps;
    item["type"] = found.type;
    item["source"] = found.source;
    item["device"] = found.device;
    item["numbers"] = ListOf(found.numbers);
    item["trees"] = ListOf(found.trees);
    text["file_systems"].append(std::move(item));
  }
  for (const Plan::LeftOut& left : plan.left_out) {
    Json::Value item;
    item["tree"] = left.tree;
    item["why"] = left.why;
    text["left_out"].append(std::move(item));
  }
  return JsonText(text, JsonBytes::kRaw);
}

bool ParsePlan(std::string_view text, Plan* plan) {
  Json::Value parsed;
  if (!ParseJson(text, &parsed) || !parsed.isObject()) return false;
  for (const Json::Value& item : parsed["file_systems"]) {
    plan->file_systems.push_back({item["id"].asString(), item["keeps"].asBool(),
                                  item["type"].asString(), item["source"].asString(),
                                  item["device"].asString(), TextsOf(item["numbers"]),
                                  TextsOf(item["trees"])});
  }
  for (const Json::Value& item : parsed["left_out"]) {
    plan->left_out.push_back({item["tree"].asString(), item["why"].asString()});
  }
  return true;
}

}  // namespace nas
