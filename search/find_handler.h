#pragma once
// Handler of the API "NUVA.Arbory.Search". Starting a search forks a worker process that runs it;
// listing, stopping and cleaning are later requests that find the search through its task record
// (platform/task_record.h). There are no threads. Processes are forked in start.cpp and
// stop_clean.cpp, which say what each may touch and how it ends; WebFMFindAction and what it calls
// run in the worker, all else in the process that serves the request, under the user's identity.

#include <sys/types.h>

#include <string>
#include <vector>

#include "api/webfm_webapi.h"
#include "platform/filesearch.h"
#include "platform/webapi.h"
#include "platform/webfm.h"

// Bits of the parameter "additional": the optional attributes of a listed file.
enum AdditionalAttribute : int {
  kRealPath = 1,
  kSize = 2,
  kOwner = 4,
  kTime = 8,
  kPerm = 16,
  kType = 32,
};

class ArboryFindHandler final : public FileWebAPI, private WebfmUserEnum {
 public:
  ArboryFindHandler(NUVA::APIRequest* request, NUVA::APIResponse* response)
      : FileWebAPI(request, response) {}

  // Calls the method handler by the request's method name and releases the task object that it
  // left in pTask, also when it throws.
  void Process() override;

  // The method handlers. Each answers through SetResponse or SetError; the truth value says
  // whether a result was prepared. Listing may wait for a minute, as may stopping for each search
  // that has not got going; the others answer at once. The worker that starting forks does not
  // return from here, nor do the children of the cleans, with the one exception told in start.cpp.
  bool WebFMFindHandler();
  bool WebFMFindRemainResultHandler();
  bool WebFMFindCancelHandler();
  bool WebFMFindCleanHandler();
  bool WebFMFindCleanAllHandler();

  // Brings the user's own home, given as "/home", to its form under "/homes", and merges it with
  // what was given there. Locations outside the homes come first and are not compared.
  Json::Value RemoveDuplicatedLocations(const Json::Value& locations) const;

  // The worker's whole search: criteria, history, count, walk. `result` becomes the criteria
  // object. True when the walk completed or the worker was told to stop; false with the error set.
  bool WebFMFindAction(const std::vector<std::string>& folders, Json::Value& result);

  // Appends a comparator for each criterion of the request to `comps`, which the caller owns also
  // when this fails, and copies the criteria to `criteria`. False when a criterion is refused (the
  // reason is in WfmLibGetErr) or the request has none at all.
  bool CreateFindOp(std::vector<FileSearch::FindComp*>& comps, Json::Value& criteria);

  // Writes where the results will be into the task and walks. `comps` is borrowed; "recursive" and
  // "search_content" are added to `options`.
  bool Recursive_Find(const std::vector<std::string>& paths,
                      const std::vector<FileSearch::FindComp*>& comps, Json::Value& options);

  // Remember the search for the user, see history/recording.h. They report nothing, throw nothing
  // and never stop a search.
  void SetSearchHistory(const Json::Value& criteria);
  void SetSearchCount();

  // The mask of the parameter "additional".
  int ParseFileAdditional();

  // Puts the request's page of the result database `id` on `volume` into `response`: "files",
  // "total", "offset". The last four arguments go to the query as they are.
  bool WebFMQueryResult(int additional, const char* volume, const char* id, Json::Value& response,
                        const Json::Value& task_data, const char* sort_by, const bool* ascending,
                        const _tag_dir_entry_type_* type, const char* pattern);

  // Callback of a string splitter: adds `piece` to the vector of strings whose address `context`
  // is; does nothing when that is 0.
  static void StringExplodeCB(std::string& piece, long context);

 private:
  // Start, in the parent and in the worker.
  bool AnswerStart(pid_t worker, const Json::Value& locations);
  bool RunWorker(const Json::Value& locations);
  bool TakeSessionIdentity(const std::string& session);
  bool RecordOutcome(bool succeeded, Json::Value& result);
  bool WriteWalkRecord(FileSearch::WfmSearchWalker& walker);
  // Listing; those that return false have set the error.
  bool AnswerPage(int additional, const std::string& task_id);
  bool WaitForDatabase(const std::string& task_id, Json::Value& task_data);
  _tag_dir_entry_type_ RequestedType() const;
  bool RequestedPage(unsigned long& offset, unsigned long& limit);
  // Stopping and cleaning.
  Json::Value RequestedTaskIds() const;
  void CleanSearches(const Json::Value& ids, OKT::TaskMgr& tasks,
                     const FileSearch::WfmSearchDBTaskMgr& databases);
  void RemoveSearchFolders();
};
