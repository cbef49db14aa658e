#include "arbory/serve_command.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "arbory/caller.h"
#include "arbory/search_text.h"
#include "arbory/server/service/pages.h"
#include "arbory/server/service/sample_share.h"
#include "arbory/server/service/service.h"
#include "arbory/server/transport/http_server.h"
#include "arbory/terminal.h"
#include "nas/fleet/library.h"
#include "nas/system/confine.h"
#include "nas/system/shares.h"
#include "nas/webapi/runner.h"

namespace arbory {
namespace {

void Say(const std::string& line) { WriteOut(STDOUT_FILENO, line + "\n"); }

nas::ServerSettings SettingsOf(const ServeOptions& options) {
  nas::ServerSettings settings = nas::CurrentConfig().server;
  if (!options.listen.empty()) settings.listen = options.listen;
  // On a terminal the lines would push the address away that is to be opened.
  if (isatty(STDERR_FILENO) != 0) settings.access_log = false;
  return settings;
}

// A share to try it with, where there is nothing else to search.
void OfferSample(Caller* caller) {
  if (!nas::ListShares().empty() || !nas::CurrentConfig().shares.empty()) return;
  const auto folder = MakeSampleShare(nas::CurrentConfig().state_dir);
  if (!folder) {
    Complain(
        "no share is configured, and the sample share's files are not installed; give a folder "
        "with --share NAME=DIR");
    return;
  }
  caller->AddShares({{kSampleShare, *folder}});
  Say("No share is configured: offering the sample share in " + *folder);
}

// A disk that is not mounted, or a slip of the pen: the server runs without the share, which is
// there as soon as its folder is.
void WarnOfMissingShares() {
  for (const nas::ShareSetting& share : nas::CurrentConfig().shares) {
    if (nas::FindShare(share.name)) continue;
    const std::string place = share.origin.empty() ? std::string() : share.origin + ": ";
    Complain(place + "the share " + share.name + " is not offered: there is no folder " +
             share.directory);
  }
}

// The program as root without --user: people log in, and each request runs as its user.
bool HasLogins(const ServeOptions& options) {
  return geteuid() == 0 && options.common.user.empty();
}

Service::Setup SetupOf(const ServeOptions& options, const nas::ServerSettings& settings,
                       const Caller& caller, const HttpServer& server) {
  Service::Setup setup;
  setup.settings = settings;
  if (!HasLogins(options)) setup.single_user = caller.user();
  // Browsers keep one cookie jar for all ports of a machine; the prefix binds it to this host.
  setup.cookie = settings.behind_tls ? "__Host-arbory" : "arbory_" + std::to_string(server.port());
  setup.site = {server.on_loopback(), settings.behind_tls, settings.origins};
  setup.web_dir = FindWebFolder(settings.web_dir);
  setup.counts = [&server] { return server.counts(); };
  return setup;
}

void WarnOfMissingHelpers() {
  if (nas::CanConfine()) return;
  Complain(
      "bubblewrap is not installed: removing all searches of a user at once will leave their "
      "results where they are");
}

// Only what would leave nothing of the page.
void WarnOfMissingParts(const Service::Setup& setup, const Caller& caller) {
  if (access((setup.web_dir + "/index.html").c_str(), R_OK) != 0) {
    Complain("the page is not there: " + setup.web_dir + "/index.html: " + std::strerror(errno));
  }
  if (setup.single_user.empty()) return;
  const std::string why = WhyNoSearch(caller);
  if (!why.empty()) Complain("nothing can be searched: " + why);
}

void WarnOfOpenDoors(const ServeOptions& options, const nas::ServerSettings& settings,
                     const HttpServer& server) {
  if (!server.on_loopback() && !settings.behind_tls) {
    Complain(
        "listening beyond this machine without TLS: passwords and files can be read on the way; "
        "put a proxy with TLS in front and set behind_tls");
  }
  const std::string folder = settings.pam_dir.empty() ? "/etc/pam.d" : settings.pam_dir;
  const std::string service = folder + "/" + settings.pam_service;
  if (HasLogins(options) && access(service.c_str(), R_OK) != 0) {
    Complain("there is no PAM service file " + service +
             ", so every login will be refused; packaging/pam/arbory is one");
  }
}

}  // namespace

int RunServeCommand(const ServeOptions& options) {
  Caller caller(options.common);
  if (options.fleet.empty()) {
    OfferSample(&caller);
  } else {
    caller.AskFleet(nas::LoadFleet(options.fleet));
    // Inherited by every child that asks.
    nas::LoadFleetLibrary().prepare_client();
  }
  WarnOfMissingShares();
  WarnOfMissingHelpers();
  const nas::ServerSettings settings = SettingsOf(options);
  HttpServer server(settings);
  const Service::Setup setup = SetupOf(options, settings, caller, server);
  Service service(setup, caller.module());
  WarnOfOpenDoors(options, settings, server);
  nas::PrepareForCalls();
  WarnOfMissingParts(setup, caller);
  const std::string base = "http://" + server.address() + "/";
  if (HasLogins(options)) {
    Say("Open " + base);
  } else {
    const auto offer = [&] { Say("Open " + base + "open?token=" + service.NewToken()); };
    offer();
    server.OnHangup(offer);
  }
  server.Run(&service);
  return kExitSuccess;
}

}  // namespace arbory
