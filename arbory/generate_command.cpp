#include "arbory/generate_command.h"

#include <fcntl.h>

#include <filesystem>
#include <stdexcept>

#include "arbory/completions.h"
#include "arbory/manual.h"
#include "nas/base/file_io.h"

namespace arbory {
namespace {

constexpr mode_t kMode = 0644;
constexpr size_t kMaxSampleBytes = size_t{1} << 20;

void Write(const std::filesystem::path& file, const std::string& text) {
  std::filesystem::create_directories(file.parent_path());
  const nas::Status written = nas::ReplaceFile(AT_FDCWD, file, text, kMode, nas::Durability::kNone);
  if (!written) throw std::runtime_error("cannot be written: " + written.error().Text());
}

}  // namespace

int RunGenerateCommand(const GenerateOptions& options, const ProgramText& program) {
  const auto sample = nas::ReadWholeFile(AT_FDCWD, options.sample, kMaxSampleBytes);
  if (!sample) throw std::runtime_error("cannot be read: " + sample.error().Text());
  std::vector<ManualPage> pages = ManualPages(program, ARBORY_VERSION, options.date);
  pages.push_back(ConfigurationPage(*sample, ARBORY_VERSION, options.date));
  const std::filesystem::path folder = options.folder;
  for (const ManualPage& page : pages) {
    const std::string section(1, page.section);
    Write(folder / "man" / ("man" + section) / (page.name + "." + section), page.text);
  }
  Write(folder / "bash-completion/completions/arbory", BashCompletion(program));
  Write(folder / "zsh/vendor-completions/_arbory", ZshCompletion(program));
  Write(folder / "fish/vendor_completions.d/arbory.fish", FishCompletion(program));
  return kExitSuccess;
}

}  // namespace arbory
