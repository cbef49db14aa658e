#pragma once
// The row callback of a listing and its context.

#include <list>
#include <string>

#include "platform/filesearch.h"
#include "platform/webfm.h"

// Context of one WebFMQueryResult call, shared by all of its rows.
struct _tag_SELECTCBDATA_ {
  int additional = 0;         // mask of AdditionalAttribute
  bool home_enabled = false;  // whether the user has a home of his own
  std::list<DIRENTRY_INFO>* files = nullptr;
  std::string home_folder;  // of a domain account, below "homes"; looked up once
  std::string user;         // login name
  bool consistent = true;   // false once a vanished file's rows were purged
};

// Turns one row into a record at the end of the list, and purges the rows of a file that is gone.
// Needs dbTask. Returns 0 to end the selection.
BOOL SelectFileInfoCB(FileSearch::__tag_FILE_INFO_DATA* row, void* context);
