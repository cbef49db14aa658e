// Child processes and words for the shell.

#include <unistd.h>

#include <cstring>
#include <string>

#include "nas/base/error.h"
#include "platform/system.h"

pid_t NLIBCProcFork() {
  const pid_t pid = fork();
  if (pid < 0) nas::SetLastError(nas::kErrorOther);
  if (pid == 0) setsid();
  return pid;
}

// Within single quotes the shell gives no byte a meaning, so only a single quote itself must step
// outside them.
int NLIBCEncShParam(const char* text, char* buffer, size_t size) {
  if (text == nullptr || buffer == nullptr) return -1;
  std::string word = "'";
  for (const char* at = text; *at != '\0'; ++at) {
    if (*at == '\'') {
      word += "'\\''";
    } else {
      word += *at;
    }
  }
  word += '\'';
  if (word.size() + 1 > size) return -1;
  std::memcpy(buffer, word.c_str(), word.size() + 1);
  return 0;
}
