#pragma once
// Base of every request handler: the life of one API call. The umask is saved and restored around
// it, the process takes the logged-in user's identity before any work, and exactly one reply is
// sent after all of it. Handlers only record a result or an error here; they never write to the
// response themselves.

#include <json/value.h>

#include <cstdint>

#include "platform/webapi.h"

class FileWebAPI {
 public:
  // Saves the umask. Both pointers are borrowed and must outlive the handler.
  FileWebAPI(NUVA::APIRequest* request, NUVA::APIResponse* response);
  FileWebAPI(const FileWebAPI&) = delete;
  FileWebAPI& operator=(const FileWebAPI&) = delete;

  // Serves the call. The identity switch is not undone: the process, and those that it forks, stay
  // that user. What Process throws passes through, and no reply is sent then.
  virtual void Run();
  // The handler's work; reports through SetResponse and SetError, of which the last call wins.
  virtual void Process() = 0;

  void OutputResponse();
  void SetResponse(Json::Value& result);
  // The same for a result that the caller has no more use for: a page may be too large to copy.
  void SetResponse(Json::Value&& result);
  void SetError(int code, Json::Value& detail);
  void SetError(int code);
  // 0 as long as no error has been set.
  int GetError() const { return error_; }

  int ParseErrnoToError(int err, const char* path, const char* other_path);
  // Makes `out` the object {"code", "path"}.
  void ParseFileError(const char* path, int code, Json::Value& out);
  // An error whose detail is an array of one such object.
  void SetFileError(int code, const char* path, int file_code);

 protected:
  // Restores the umask. Not virtual on purpose: handlers are made and destroyed by their concrete
  // type, and the virtual table holds Run and Process and nothing else.
  ~FileWebAPI();

  NUVA::APIRequest* request() const { return request_; }

 private:
  std::uint32_t saved_umask_ = 0;
  std::int32_t error_ = 0;
  Json::Value data_;
  NUVA::APIRequest* request_;
  NUVA::APIResponse* response_;
};
