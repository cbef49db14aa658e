#!/bin/sh
# What a server sees of the module: one exported function, and no library but the platform's, JsonCpp
# and the language's own. And nothing that stands beside it looks for libraries in the current folder.
# Usage: check_exports.sh MODULE
set -eu
failed=0
expect_none() {
  [ -z "$2" ] || { echo "$1:"; echo "$2"; failed=1; }
}

exports=$(nm -D --defined-only "$1" | awk '{print $3}')
[ "$exports" = GetAPITable ] || { echo "exported: $exports"; failed=1; }

needed=$(readelf -d "$1" | sed -n 's/.*(NEEDED).*\[\(.*\)\]/\1/p')
[ -n "$needed" ] || { echo "no libraries listed"; failed=1; }
expect_none "other libraries" "$(echo "$needed" |
  grep -Ev '^(libarbory_nas|libjsoncpp|libstdc\+\+|libgcc_s|libc|libm|ld-linux.*)\.so' || true)"

for file in "$(dirname "$1")"/arbory "$(dirname "$1")"/*.so; do
  path=$(readelf -d "$file" | sed -n 's/.*R.*PATH.*\[\(.*\)\]/\1/p')
  [ -z "$path" ] || expect_none "relative library path of $file" "$(echo "$path" | tr : '\n' |
    grep -v '^[/$]' | sed 's/^/entry: /')"
done

exit $failed
