#pragma once
// What the server itself looks up for a user, as rows like the module's: they run in a request
// child under the user's identity, and their reply is the JSON of an HTTP answer (EncodeOwnReply),
// whose status is the reply's code: 503 when the server cannot act as the user. The pid is -1, with
// errno set, when nothing can be forked. Of the loop's thread alone.

#include <string>

#include "nas/webapi/runner.h"

namespace arbory {

// For rows like these elsewhere: forks the child, whose entry function sets the HTTP status as its
// code; has it step down to the user for good, which answers itself when that fails; the body of an
// error; and the sentence for parameters of another type than docs/http.md names.
nas::Child StartOwn(NUVA::APIEntry entry, const nas::ApiCall& call);
bool BecomeCaller(NUVA::APIRequest* request, NUVA::APIResponse* response);
Json::Value OwnError(int status, const char* sentence);
inline constexpr char kWrongType[] = "A field has a wrong type; docs/http.md names them.";
// The code is the HTTP status and the data its JSON body.
nas::Reply EncodeOwnReply(int code, const Json::Value& data);
// Answers with an error's status and sentence.
void RefuseOwn(NUVA::APIResponse* response, int status, const char* sentence);

// Whether the process's user can enter and list the folder that a share begins with.
bool CanList(const std::string& folder);

// {"shares":[{"name","indexed"}],"homes":BOOL}: the shares the user can enter and list. With
// `asks_fleet` those of a fleet's boxes too, as "BOX/SHARE", and in "boxes" the "state" and "why"
// of each that has not answered, by name.
nas::Child StartListShares(const nas::ApiCall& call);

// {"taskid","finished","progress","errno","location","walk"} of the user's search; 404 when there
// is none of that id.
nas::Child StartReadSearch(const std::string& user, const std::string& task_id);

// What was typed, as the parameters of a search's start: {"params"}, or {"wrong":{"criterion",
// "sentence"}} where it cannot be understood; and the "spans" of the pattern (query_help.h). The
// call's parameters are those of a start, sizes and times as texts: "size_from", "size_to", and
// bounds as "mtime", "crtime" and "atime". With a place in the pattern as "caret" there is
// "completion" too, where something can be offered.
nas::Child StartReadQuery(const nas::ApiCall& call);
// The same reply, waited for in the process that calls it, which is to end soon.
nas::Reply ReadQuery(const nas::ApiCall& call);

// What the index knows at once: {"index","found","more","rows"} (nas/search/instant.h), or
// {"wrong"} as StartReadQuery has it. The call's parameters are those of StartReadQuery and
// "folder_path", a location or several; without it all shares that the user can list.
nas::Child StartInstant(const nas::ApiCall& call);

// What the user's search, started with the call's parameters, came close to in its folders:
// {"complete","entries","folders","left_out","meant","terms":[{"written","without","names"}]}; 404
// when there is no such search.
nas::Child StartNearMisses(const nas::ApiCall& call, const std::string& task_id);

// Stops the user's running searches by the module's own method "stop". {"stopped":N}.
nas::Child StartStopSearches(const std::string& user, const NUVA::APIMethod& stop);

// Has the call's parameters read and gives `reply` where they are well-formed.
nas::Child StartReply(const nas::ApiCall& call, const nas::Reply& reply);

}  // namespace arbory
