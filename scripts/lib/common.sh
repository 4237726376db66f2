#!/usr/bin/env bash
# What the scripts share: the project's root, messages, the list of help. Sourced, never run.

# The scripts work from any directory.
# shellcheck disable=SC2034
root=$(cd "$(dirname "${BASH_SOURCE[0]}")/../.." && pwd)

say() { printf '%s\n' "$*"; }
die() {
  printf '%s: %s\n' "$(basename "$0")" "$*" >&2
  exit 1
}

# A script's own help is the comment between these words and the first line of code.
usage() {
  sed -n '/^# usage:/,/^[^#]/{/^#/s/^# \{0,1\}//p}' "$0"
}

# Answers --help wherever it stands among the arguments.
answer_help() {
  local argument
  for argument in "$@"; do
    case $argument in
      -h | --help)
        usage
        exit 0
        ;;
    esac
  done
}

processors() { nproc 2>/dev/null || echo 1; }
