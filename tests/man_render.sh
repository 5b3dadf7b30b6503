#!/bin/sh
# Every man page renders at 80 columns without a troff warning, as
# `MANWIDTH=80 man --warnings -l PAGE` shows it.
#   man_render.sh PAGE...
# Exit 77 (skipped) without man-db's man.
set -eu
command -v man >/dev/null || { echo "skipped: no man"; exit 77; }
status=0
for page in "$@"; do
    warnings=$(MANWIDTH=80 man --warnings -l "$page" 2>&1 >/dev/null)
    if [ -n "$warnings" ]; then
        echo "$page:"
        echo "$warnings"
        status=1
    fi
done
exit $status
