# Sourced by ./demo and ./test: installs the Debian packages of packages.txt that are missing, or says which those are.
ensure_packages() {
  local list="$1" wanted missing=()
  mapfile -t wanted < <(grep -v '^#' "$list")
  local package
  for package in "${wanted[@]}"; do
    dpkg-query -W -f='${Status}' "$package" 2>/dev/null | grep -q 'ok installed' || missing+=("$package")
  done
  [ ${#missing[@]} -eq 0 ] && return 0

  local as_root=()
  if [ "$(id -u)" -ne 0 ]; then
    if ! command -v sudo >/dev/null; then
      echo "These Debian packages are missing, and installing them needs root: ${missing[*]}" >&2
      echo "Run as root: apt-get install --no-install-recommends ${missing[*]}" >&2
      return 1
    fi
    as_root=(sudo)
  fi
  if ! command -v apt-get >/dev/null; then
    echo "There is no apt-get here. Install what these Debian packages hold: ${missing[*]}" >&2
    return 1
  fi
  echo "Installing ${missing[*]}"
  local log
  log=$(mktemp)
  if ! { "${as_root[@]}" apt-get update && "${as_root[@]}" env DEBIAN_FRONTEND=noninteractive \
         apt-get install -y --no-install-recommends "${missing[@]}"; } >"$log" 2>&1; then
    tail -n 20 "$log" >&2
    echo "apt-get failed (its output is in $log); the packages wanted are: ${missing[*]}" >&2
    return 1
  fi
  rm -f "$log"
}

# build_vemo FOLDER TARGET CMAKE-OPTIONS...: configures and builds quietly; shows the end of the log when that fails.
build_vemo() {
  local folder="$1" target="$2"
  shift 2
  mkdir -p "$folder"
  echo "Building $target in $folder (log: $folder/build.log)"
  if ! { cmake -G Ninja -S . -B "$folder" "$@" && cmake --build "$folder" --target "$target" -j "$(nproc)"; } \
       >"$folder/build.log" 2>&1; then
    grep -nE 'error|FAILED' "$folder/build.log" | head -n 20 >&2
    tail -n 20 "$folder/build.log" >&2
    echo "The build failed; the whole log is in $folder/build.log" >&2
    return 1
  fi
}
