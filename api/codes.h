#pragma once
// Web API error codes that the module itself decides on. Others are passed through from the web
// file manager library.

enum ApiCode : int {
  kCodeBadCall = 101,       // unknown method; an offset or limit that is no number
  kCodeBadParameter = 400,  // a required parameter is missing or empty
  kCodeFailed = 401,        // task, fork, identity or store failure
  kCodeNoSuchAccount = 405,
  kCodePermission = 407,
  kCodeNoSuchFolder = 408,
  kCodeIllegalPath = 418,
  kCodeNoResults = 600,  // result database not ready, or its query failed
};
