// The one function by which the library is found.

#include "nas/fleet/library.h"
#include "nas/fleet/plugin/client.h"
#include "nas/fleet/plugin/signatures.h"

extern "C" __attribute__((visibility("default"))) const nas::FleetLibrary* ArboryFleetLibrary() {
  static const nas::FleetLibrary library = {
      nas::Sha256,        nas::Sign, nas::IsSigned, nas::MakeKey, nas::PrepareFleetClient,
      nas::NewFleetClient};
  return nas::PrepareSignatures() ? &library : nullptr;
}
