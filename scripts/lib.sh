# What the scripts share: installing what is missing, and building a preset quietly. Sourced with
# `top` set to the root of the tree. All output goes to standard error, so that a script's standard
# output is only that of the program it runs.

say() { printf '%s\n' "$*" >&2; }

# need GROUP...: the packages of these groups of scripts/packages, installed where missing. A stamp
# makes the check free until the list changes.
need() {
  local stamp="$top/build/.packages-$*" wanted missing
  if cmp -s "$top/scripts/packages" "$stamp"; then return; fi
  wanted=$(awk -v groups=" $* " 'index(groups, " " $1 " ") { print $2 }' "$top/scripts/packages")
  missing=$(for name in $wanted; do
    [ "$(dpkg-query -W -f '${db:Status-Status}' "$name" 2>/dev/null)" = installed ] || echo "$name"
  done)
  if [ -n "$missing" ]; then install_packages $missing; fi
  mkdir -p "$top/build"
  cp "$top/scripts/packages" "$stamp"
}

install_packages() {
  local as_root=()
  if [ "$(id -u)" != 0 ]; then
    if ! command -v sudo >/dev/null; then
      say "These packages are missing and only root can install them:"
      say "  apt-get install $*"
      exit 2
    fi
    as_root=(sudo)
  fi
  say "Installing $*"
  local apt=("${as_root[@]}" env DEBIAN_FRONTEND=noninteractive apt-get -qq)
  if ! { "${apt[@]}" update && "${apt[@]}" install --no-install-recommends -y "$@"; } >&2; then
    say "The packages could not be installed."
    exit 2
  fi
}

# build PRESET [TARGET...]: configures where needed and builds. Silent when there is little to do,
# otherwise says so; the compiler's output is shown only when it fails. Two at once take turns.
build() {
  local preset=$1 dir="$top/build/$1" log
  shift
  mkdir -p "$dir"
  exec 9>"$dir/.lock"
  flock 9
  log="$dir/build.log"
  if [ ! -f "$dir/build.ninja" ]; then
    say "Building in build/$preset, which takes a few minutes the first time ..."
    (cd "$top" && cmake --preset "$preset") >"$log" 2>&1 9>&- || build_failed "$log"
  fi
  ninja -C "$dir" "$@" >"$log" 2>&1 9>&- || build_failed "$log"
  exec 9>&-
}

build_failed() {
  cat "$1" >&2
  say "The build failed."
  exit 2
}

# Debian's packages, from where this machine has its own: lines for sources.list.
debian_sources() {
  apt-get indextargets --format 'deb $(REPO_URI) $(RELEASE) $(COMPONENT)' \
    'Created-By: Packages' 'Origin: Debian' | sort -u
}
