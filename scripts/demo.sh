#!/usr/bin/env bash
# Shows the command-line tool at work. Usage: demo.sh PATH-TO-zantiff
set -euo pipefail
tool=${1:-build/bin/zantiff}
here=$(cd "$(dirname "$0")/.." && pwd)
run() { echo "\$ zantiff $*"; "$tool" "$@"; echo; }

run --version
run --help
