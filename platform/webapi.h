#pragma once
// The web API server's side of one call: the request a handler reads, the response it answers
// through, and the rows of the table by which the server finds a module's entry functions.
//
// Request and response belong to the server and outlive the entry function. A child process that
// the module forks may go on using its copies.

#include <json/value.h>

#include <cstdint>
#include <string>

namespace NUVA {

class APIRequest {
 public:
  virtual ~APIRequest() = default;

  virtual std::string GetLoginUserName() const = 0;
  virtual std::string GetSessionID() const = 0;
  // The directory of the logged-in user's own settings: absolute, existing, without a final "/".
  virtual std::string GetPreferenceDir() const = 0;

  // The method as the client spelled it; rows are matched without regard to letter case.
  virtual std::string GetAPIMethod() const = 0;
  virtual int GetAPIVersion() const = 0;

  virtual bool HasParam(const std::string& name) const = 0;
  // The parameter's value, or `fallback` where the request does not carry it.
  virtual Json::Value GetParam(const std::string& name, const Json::Value& fallback) const = 0;
};

class APIResponse {
 public:
  virtual ~APIResponse() = default;

  // Records the reply: code 0 means success with `data` as the result, any other code is an error
  // with `data` as its detail. Copies `data`.
  virtual void SetError(int code, const Json::Value& data) = 0;
};

// Serves one call. The reply is in the response when it returns; an exception that leaves it is
// answered by the server.
using APIEntry = void (*)(APIRequest*, APIResponse*);

// One row of a module's method table. A row whose `api` is null ends the table.
struct APIMethod {
  const char* api;
  std::int32_t version;
  const char* method;
  APIEntry entry;
};

// The type of a module's exported function `GetAPITable`.
using GetAPITableFunction = APIMethod* (*)();

}  // namespace NUVA
