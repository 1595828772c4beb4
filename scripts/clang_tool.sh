# Sourced by the checks that want a tool of clang's.
# clang_tool NAME: sets `tool` to the command of version 14, whose rules the tree follows. Ends the
# check: as failed when there is no such program or its configuration cannot be read; as done,
# saying so, when only another version's is there, which would find other things.
clang_tool() {
  local check=${0##*/} version
  tool=$(command -v "$1-14" || command -v "$1" || true)
  if [[ -z $tool ]]; then
    echo "$check: $1 is missing; scripts/setup.sh --checks installs it" >&2
    exit 1
  fi
  version=$("$tool" --version)
  if [[ ! $version =~ version\ 14\. ]]; then
    echo "$check: not done: this $1 judges otherwise than that of version 14 (${version//$'\n'/ })"
    exit 0
  fi
  if [[ $("$tool" --dump-config 2>&1 >/dev/null) == *error* ]]; then
    echo "$check: the configuration of $1 cannot be read" >&2
    exit 1
  fi
}
