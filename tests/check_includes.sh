#!/bin/sh
# Which folder may include which, over every C++ file of the tree: besides itself, a folder includes
# what stands behind it and nothing else. A folder that has no line has its parent's. Three rules hold
# the house together: the module (module/ search/ history/ api/) knows nothing of nas/, nas/ knows
# nothing of the module, and arrows never form a circle. A library that stands in angle brackets
# belongs to the lines that name it; JsonCpp is everybody's.
# Usage: check_includes.sh SOURCE_DIR
set -eu
rules='
platform                 :
api                      : platform
history                  : api platform
search                   : history api platform
module                   : search history platform
nas/base                 : platform <sqlite3.h>
nas/system               : nas/base platform <acl> <sys/acl.h> <toml++>
nas/files                : nas/base
nas/match                : nas/base <pcre2.h> <utf8proc.h>
nas/results              : nas/base nas/files nas/match
nas/index                : nas/base nas/system nas/files nas/match platform <xxhash.h>
nas/fleet                : nas/base nas/files nas/match nas/results nas/system
nas/fleet/plugin         : nas/base nas/fleet <sodium.h> <curl>
nas/search               : nas/base nas/files nas/match nas/results nas/index nas/fleet nas/system platform
nas/tasks                : nas/base nas/system platform
nas/records              : nas/base nas/system platform
nas/webapi               : nas/base nas/fleet nas/system platform
arbory                   : nas platform arbory/server <CLI>
arbory/server/transport  : nas platform <boost>
arbory/server/service    : nas platform arbory arbory/server/transport <zlib.h>
arbory/server/plugin     : nas arbory/server/service arbory/server/transport <security> <archive.h> <archive_entry.h>
bench                    : nas platform <benchmark>
tests                    : platform api history search module nas arbory <sqlite3.h> <CLI> <utf8proc.h> <boost> <zlib.h>
'
cd "$1"
find . -path './build*' -prune -o -name node_modules -prune -o \( -name '*.h' -o -name '*.cpp' \) -print |
  sed 's|^\./||' | xargs grep -HnE '^ *# *include ["<]' | RULES="$rules" awk '
  # The line of the table for a folder: its own or that of the nearest folder around it.
  function line_of(folder) {
    while (!(folder in allowed) && sub("/[^/]*$", "", folder)) {}
    return folder in allowed ? folder : ""
  }
  function may(from, to,  word, count, words, i) {
    count = split(allowed[from], words, " ")
    for (i = 1; i <= count; ++i) if (to == words[i] || index(to, words[i] "/") == 1) return 1
    return line_of(to) == from
  }
  BEGIN {
    count = split(ENVIRON["RULES"], lines, "\n")
    for (i = 1; i <= count; ++i) if (split(lines[i], side, " *: *") == 2) {
      allowed[side[1]] = side[2]
      words = split(side[2], word, " ")
      for (w = 1; w <= words; ++w) if (word[w] ~ /^</) owned[word[w]] = 1
    }
  }
  {
    file = $0; sub(":.*", "", file)
    folder = file; sub("/[^/]*$", "", folder)
    name = $0; sub("^[^\"<]*[\"<]", "", name); sub("[\">].*", "", name)
    seen[file] = 1
    from = line_of(folder)
    if ($0 ~ /include </) {
      library = "<" name ">"
      if (!(library in owned)) { sub("/.*", ">", library) }
      bad = (library in owned) && index(" " allowed[from] " ", " " library " ") == 0
    } else {
      to = name; sub("/[^/]*$", "", to)
      bad = !may(from, to)
    }
    if (from == "" || bad) { print; failed = 1 }
  }
  END {
    for (file in seen) ++files
    if (files < 100) { print "only " files " files with includes were found"; failed = 1 }
    exit failed
  }'
