#pragma once
// Web API error codes that the module itself decides on. Others are passed through from the web
// file manager library.

#include "platform/errors.h"

enum ApiCode : int {
  kCodeBadCall = 101,               // unknown method; an offset or limit that is no number
  kCodeBadParameter = 400,          // a required parameter is missing or empty
  kCodeFailed = web_code::kFailed,  // task, fork, identity or store failure
  kCodeNoResults = 600,             // result database not ready, or its query failed
};
