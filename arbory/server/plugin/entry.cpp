#include "arbory/server/plugin/pam_checks.h"
#include "arbory/server/plugin/zip_stream.h"

extern "C" [[gnu::visibility("default")]] const arbory::ServerLibrary* ArboryServerLibrary() {
  static constexpr arbory::ServerLibrary kLibrary = {
      .new_zip = arbory::NewZip,
      .check_login = arbory::CheckLogin,
      .check_account = arbory::CheckAccount,
  };
  return &kLibrary;
}
