#include "api/webfm_webapi.h"

#include <syslog.h>

#include <cerrno>
#include <string>
#include <utility>

#include "api/log.h"
#include "platform/webfm.h"

FileWebAPI::FileWebAPI(NUVA::APIRequest* request, NUVA::APIResponse* response)
    : request_(request), response_(response) {
  saved_umask_ = WfmLibUmask();
}

FileWebAPI::~FileWebAPI() { WfmLibRestoreUmask(saved_umask_); }

void FileWebAPI::Run() {
  int switched = 0;
  int failure = 0;
  {
    const std::string user = request_->GetLoginUserName();
    switched = WfmLibUGIDSet(nullptr, user.c_str());
    failure = errno;
  }
  if (switched < 0) {
    SetError(WfmLibGetErr());
    errno = failure;  // what %m is about; the calls in between may have changed it
    syslog(LOG_ERR, "%s:%d Failed to set UGID, %m", kBaseLogSource, log_line::kRunIdentity);
    OutputResponse();
    return;
  }
  Process();
  OutputResponse();
}

void FileWebAPI::OutputResponse() { response_->SetError(error_, data_); }

void FileWebAPI::SetResponse(Json::Value& result) {
  data_ = result;
  error_ = 0;
}

void FileWebAPI::SetResponse(Json::Value&& result) {
  data_ = std::move(result);
  error_ = 0;
}

void FileWebAPI::SetError(int code, Json::Value& detail) {
  data_ = detail;
  error_ = code;
}

void FileWebAPI::SetError(int code) {
  Json::Value nothing;
  SetError(code, nothing);
}

int FileWebAPI::ParseErrnoToError(int err, const char* path, const char* other_path) {
  return WfmParseErrnoToError(err, path, other_path);
}

void FileWebAPI::ParseFileError(const char* path, int code, Json::Value& out) {
  out["code"] = code;
  out["path"] = path;
}

void FileWebAPI::SetFileError(int code, const char* path, int file_code) {
  Json::Value details(Json::arrayValue);
  Json::Value detail;
  ParseFileError(path, file_code, detail);
  details.append(detail);
  SetError(code, details);
}
