// Clean-all has no row of its own: it is reached by a method that the search handler does not know
// together with the parameter "action".

#include "module/table.h"

#include "history/handlers.h"
#include "search/find_handler.h"

namespace {

constexpr char kSearch[] = "NUVA.Arbory.Search";
constexpr char kHistory[] = "NUVA.Arbory.Search.History";
constexpr char kStart[] = "start";
constexpr char kList[] = "list";
constexpr char kStop[] = "stop";
constexpr char kClean[] = "clean";

// Both versions of the search API are served by the same code.
NUVA::APIMethod gTable[] = {
    {kSearch, 1, kStart, SearchAPIEntry},
    {kSearch, 1, kList, SearchAPIEntry},
    {kSearch, 1, kStop, SearchAPIEntry},
    {kSearch, 1, kClean, SearchAPIEntry},
    {kSearch, 2, kStart, SearchAPIEntry},
    {kSearch, 2, kList, SearchAPIEntry},
    {kSearch, 2, kStop, SearchAPIEntry},
    {kSearch, 2, kClean, SearchAPIEntry},
    {kHistory, 1, "get", SearchHistoryGetEntry},
    {kHistory, 1, "set", SearchHistorySetEntry},
    {kHistory, 1, "delete", SearchHistoryDeleteEntry},
    {nullptr, 0, nullptr, nullptr},
};

template <class Handler>
void Serve(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  Handler handler(request, response);
  handler.Run();
}

}  // namespace

NUVA::APIMethod* GetAPITable() { return gTable; }

void SearchAPIEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  Serve<ArboryFindHandler>(request, response);
}

void SearchHistoryGetEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  Serve<SearchHistortGet>(request, response);
}

void SearchHistorySetEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  Serve<SearchHistortSet>(request, response);
}

void SearchHistoryDeleteEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  Serve<SearchHistortDelete>(request, response);
}
