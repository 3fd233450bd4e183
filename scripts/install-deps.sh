#!/usr/bin/env bash
# Installs, with apt-get, the Debian packages a group of jobs needs, and only
# those that are missing (so a prepared machine is not touched).
#   install-deps.sh GROUP...   groups: build tests arm static docs bench package clang
# (the groups are in scripts/lib.sh)
set -euo pipefail
source "$(dirname "${BASH_SOURCE[0]}")/lib.sh"
ulo_install "$@"
