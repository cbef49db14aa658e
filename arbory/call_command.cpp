#include "arbory/call_command.h"

#include <unistd.h>

#include <string>

#include "arbory/caller.h"
#include "arbory/terminal.h"
#include "nas/base/json_text.h"

namespace arbory {
namespace {

Json::Value ParseParams(const std::string& text) {
  Json::Value params(Json::objectValue);
  if (text.empty()) return params;
  if (!nas::ParseJson(text, &params, nas::kRequestMaxDepth))
    throw UsageError("the parameters are not valid JSON: " + text);
  if (!params.isObject()) throw UsageError("the parameters must be a JSON object: " + text);
  return params;
}

std::string Methods(const nas::Module& module) {
  std::string text;
  for (const NUVA::APIMethod* row = module.table(); row->api != nullptr; ++row) {
    text += std::string(text.empty() ? "" : ", ") + row->api + " " + std::to_string(row->version) +
            " " + row->method;
  }
  return text;
}

}  // namespace

int RunCallCommand(const CallOptions& options) {
  const Json::Value params = ParseParams(options.params);
  Caller caller(options.common);
  const NUVA::APIMethod* row = caller.module().Find(options.api, options.version, options.method);
  if (row == nullptr) {
    throw UsageError("no method " + options.api + " " + std::to_string(options.version) + " " +
                     options.method + "; there are " + Methods(caller.module()));
  }
  const nas::Reply reply = caller.Call(*row, options.method, params, nas::EncodeJsonReply);
  Print(reply.body + "\n");
  return reply.head.code == 0 ? kExitSuccess : kExitNothing;
}

}  // namespace arbory
