#pragma once
// Which trees are to be indexed, by file system. Looks at folders, which may take as long as a file
// server that does not answer: for a process of its own.

#include <string>
#include <string_view>
#include <vector>

#include "nas/index/trees.h"

namespace nas {

struct Plan {
  std::vector<FileSystem> file_systems;  // by id
  struct LeftOut {
    std::string tree;
    std::string why;
    bool operator==(const LeftOut&) const = default;
  };
  std::vector<LeftOut> left_out;
};

// What [index] names, or every share and volume: those that are there, on file systems of this
// machine that tell of all their changes. A tree that lies in another of the same is part of it.
Plan MakePlan();

// As text, for the way to another process.
std::string PlanText(const Plan& plan);
bool ParsePlan(std::string_view text, Plan* plan);

}  // namespace nas
