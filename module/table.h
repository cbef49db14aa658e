#pragma once
// The module's one exported function, by which the web API server learns what the module serves,
// and the entry functions behind the rows. An entry builds the handler of one request, runs it and
// destroys it; the reply is in the response then. What a handler throws passes to the server.

#include "platform/webapi.h"

// The method table; a row whose api is null ends it. May be called any number of times.
extern "C" NUVA::APIMethod* GetAPITable();

void SearchAPIEntry(NUVA::APIRequest* request, NUVA::APIResponse* response);
void SearchHistoryGetEntry(NUVA::APIRequest* request, NUVA::APIResponse* response);
void SearchHistorySetEntry(NUVA::APIRequest* request, NUVA::APIResponse* response);
void SearchHistoryDeleteEntry(NUVA::APIRequest* request, NUVA::APIResponse* response);
