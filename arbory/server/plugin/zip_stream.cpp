#include "arbory/server/plugin/zip_stream.h"

#include <archive.h>
#include <archive_entry.h>

#include <algorithm>
#include <array>
#include <clocale>
#include <cstdint>
#include <cstdio>
#include <ctime>
#include <memory>
#include <new>

#include "arbory/server/transport/http_text.h"
#include "nas/base/file_io.h"
#include "nas/base/system_call.h"
#include "nas/base/utf8.h"

namespace arbory {
namespace {

constexpr size_t kReadBytes = size_t{256} << 10;
constexpr size_t kChunkBytes = size_t{256} << 10;
// The quickest: the line or the disk shall be what one waits for.
constexpr char kPacking[] = "zip:compression-level=1";
constexpr char kUtf8Locale[] = "C.UTF-8";

// What is packed already; to pack it again costs time and gains nothing.
bool IsPacked(std::string_view name) {
  static constexpr std::string_view kExtensions[] = {
      "7z",  "aac",  "apk",  "avi", "avif", "bz2",  "cr2", "deb", "docx", "epub", "flac", "gif",
      "gz",  "heic", "iso",  "jar", "jpeg", "jpg",  "m4a", "m4v", "mkv",  "mov",  "mp3",  "mp4",
      "mpg", "odp",  "ods",  "odt", "ogg",  "opus", "pdf", "png", "pptx", "rar",  "rpm",  "tgz",
      "ts",  "webm", "webp", "wma", "wmv",  "xlsx", "xz",  "zip", "zst"};
  const size_t dot = name.rfind('.');
  if (dot == std::string_view::npos) return false;
  const std::string extension = LowerCase(name.substr(dot + 1));
  return std::find(std::begin(kExtensions), std::end(kExtensions), extension) !=
         std::end(kExtensions);
}

class Zip : public ZipStream {
 public:
  explicit Zip(int pipe);
  ~Zip() override;
  Zip(const Zip&) = delete;
  Zip& operator=(const Zip&) = delete;

  void AddFolder(const std::string& name, const struct stat& info) override;
  bool AddFile(const std::string& name, int fd, const struct stat& info) override;
  bool BeginFile(const std::string& name, const struct stat& info) override;
  void AddBytes(std::string_view bytes) override;
  bool EndFile() override;
  void AddText(const std::string& name, std::string_view text) override;
  void Finish() override;
  bool broken() const override { return broken_; }

 private:
  bool Begin(const std::string& name, const struct stat& info, bool packs);
  void Write(std::string_view bytes);
  static la_ssize_t WriteChunk(archive* archive, void* self, const void* bytes, size_t count);

  const int pipe_;
  std::string chunk_;
  archive* const archive_;
  std::uint64_t left_ = 0;  // bytes of the file that was begun
  bool broken_ = false;
};

la_ssize_t Zip::WriteChunk(archive* /*unused*/, void* self, const void* bytes, size_t count) {
  auto& zip = *static_cast<Zip*>(self);
  if (count == 0) return 0;  // would be the end
  std::array<char, 20> length{};
  std::snprintf(length.data(), length.size(), "%zx\r\n", count);
  zip.chunk_ = length.data();
  zip.chunk_.append(static_cast<const char*>(bytes), count);
  zip.chunk_ += "\r\n";
  return nas::WriteAll(zip.pipe_, zip.chunk_) ? static_cast<la_ssize_t>(count) : -1;
}

Zip::Zip(int pipe) : pipe_(pipe), archive_(archive_write_new()) {
  if (archive_ == nullptr) throw std::bad_alloc();
  archive_write_set_format_zip(archive_);
  archive_write_set_options(archive_, kPacking);
  archive_write_set_bytes_per_block(archive_, kChunkBytes);
  archive_write_set_bytes_in_last_block(archive_, 1);  // not filled up
  broken_ = archive_write_open(archive_, this, nullptr, WriteChunk, nullptr) != ARCHIVE_OK;
}

Zip::~Zip() {
  archive_write_fail(archive_);  // writes nothing more, even where it was not finished
  archive_write_free(archive_);
}

bool Zip::Begin(const std::string& name, const struct stat& info, bool packs) {
  if (broken_) return false;
  std::setlocale(LC_CTYPE, nas::IsUtf8(name) ? kUtf8Locale : "C");
  if (packs) {
    archive_write_zip_set_compression_deflate(archive_);
  } else {
    archive_write_zip_set_compression_store(archive_);
  }
  const std::unique_ptr<archive_entry, void (*)(archive_entry*)> entry(archive_entry_new(),
                                                                       archive_entry_free);
  if (!entry) throw std::bad_alloc();
  archive_entry_copy_pathname(entry.get(), name.c_str());
  archive_entry_set_mode(entry.get(), info.st_mode);
  archive_entry_set_mtime(entry.get(), info.st_mtime, 0);
  archive_entry_set_size(entry.get(), S_ISREG(info.st_mode) ? info.st_size : 0);
  const int result = archive_write_header(archive_, entry.get());
  broken_ = result == ARCHIVE_FATAL;
  return result >= ARCHIVE_WARN;
}

void Zip::Write(std::string_view bytes) {
  if (!broken_ && archive_write_data(archive_, bytes.data(), bytes.size()) < 0) broken_ = true;
}

void Zip::AddFolder(const std::string& name, const struct stat& info) {
  Begin(name + "/", info, false);
}

bool Zip::AddFile(const std::string& name, int fd, const struct stat& info) {
  if (!BeginFile(name, info)) return false;
  std::string buffer(kReadBytes, '\0');
  while (left_ > 0 && !broken_) {
    const size_t wanted = std::min<std::uint64_t>(left_, buffer.size());
    const ssize_t got = nas::Uninterrupted([&] { return read(fd, buffer.data(), wanted); });
    if (got <= 0) break;
    AddBytes({buffer.data(), static_cast<size_t>(got)});
  }
  return EndFile();
}

bool Zip::BeginFile(const std::string& name, const struct stat& info) {
  left_ = static_cast<std::uint64_t>(info.st_size);
  return Begin(name, info, info.st_size > 0 && !IsPacked(name));
}

void Zip::AddBytes(std::string_view bytes) {
  const size_t count = std::min<std::uint64_t>(left_, bytes.size());
  Write(bytes.substr(0, count));
  left_ -= count;
}

bool Zip::EndFile() {
  const bool whole = left_ == 0;
  const std::string zeros(whole ? 0 : kReadBytes, '\0');
  while (left_ > 0 && !broken_) AddBytes(zeros);
  return whole;
}

void Zip::AddText(const std::string& name, std::string_view text) {
  struct stat info = {};
  info.st_mode = S_IFREG | S_IRUSR | S_IWUSR | S_IRGRP | S_IROTH;
  info.st_size = static_cast<off_t>(text.size());
  info.st_mtime = std::time(nullptr);
  if (Begin(name, info, true)) Write(text);
}

void Zip::Finish() {
  if (broken_ || archive_write_close(archive_) != ARCHIVE_OK) return;
  (void)nas::WriteAll(pipe_, "0\r\n\r\n");
}

}  // namespace

ZipStream* NewZip(int pipe) { return new Zip(pipe); }

}  // namespace arbory
