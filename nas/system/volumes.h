#pragma once
// Volumes, and the temporary folder of each, VOLUME/@tmp, where searches keep their result
// databases:
//
//   VOLUME/@tmp/webfm/           0755, whoever's the volume is
//   VOLUME/@tmp/webfm/FBSearch/  0755; 01777 where it was made without root
//   ..../FBSearch/USER/          0700, the user's own
//   ..../FBSearch/.aside-*       what somebody else had put in a user's place
//
// Root makes the users' folders, so that nobody can make another's and keep them from searching;
// without root each user makes their own.
//
// The scratch volume, which holds what belongs to shares outside every volume, is none of the
// volumes but has the same folders.

#include <map>
#include <string>
#include <vector>

#include "nas/base/error.h"

namespace nas {

// Below a volume.
inline constexpr char kTemporaryFolder[] = "@tmp";

// The volumes that exist, sorted.
std::vector<std::string> ListVolumes();
std::string ScratchVolume();
// The temporary folders of all of them and of the scratch volume, there or not.
std::vector<std::string> TemporaryFolders();

// Where the user's result folder is or would be; nothing is looked at or made.
std::string ResultFolderPath(const std::string& volume, const std::string& user);
// The folder on `volume` that holds the user's result databases, as a search has left it: ENOENT
// where it is not there or `volume` is neither a volume nor the scratch volume, EPERM where it is
// not the user's own and closed, or others could replace it. Looks with the process's identity,
// which must be the user's (BecomeUser; otherwise EPERM).
Result<std::string> ResultFolder(const std::string& volume, const std::string& user);
// The same, made where missing: as root where the process can, since only root may write to a
// volume itself. Root also closes an FBSearch of its own in which everybody can write, and takes
// out of the user's place what is neither the user's nor root's. For one thread.
Result<std::string> MakeResultFolder(const std::string& volume, const std::string& user);
// On every volume where it can be: for root's processes that are about to give root up, as the
// volumes that a search will need are not known yet. For one thread.
void MakeResultFolders(const std::string& user);
// Removes, as root where the process can, the user's result folders that hold nothing: the user may
// empty the folder that root made, but not remove it. For one thread.
void RemoveEmptyResultFolders(const std::string& user);
// The volume for the result databases of a share that lies on `own_volume` (empty: on none): that
// one where the user can have a folder there, otherwise the scratch volume. Makes the folder.
Result<std::string> ResultVolume(const std::string& own_volume, const std::string& user);

// The path under which each volume, the scratch volume among them, appears to a confined command:
// its own where the pattern /volume* matches it, otherwise an unused /volumeN; the scratch volume
// is /volume0 unless a volume is.
std::map<std::string, std::string> NamesInSandbox(const std::vector<std::string>& volumes,
                                                  const std::string& scratch);

}  // namespace nas
