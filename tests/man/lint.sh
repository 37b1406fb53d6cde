#!/bin/sh
# SPDX-License-Identifier: MIT
# Lints each manual page with both formatters a reader may meet: mandoc at
# its warning level, and groff through man-db (as lintian runs it). Any
# message fails.
status=0
for page in "$@"; do
  if ! out=$(mandoc -T lint -W warning "$page" 2>&1) || [ -n "$out" ]; then
    printf '%s\n' "${out:-mandoc failed on $page}"
    status=1
  fi
  out=$(LC_ALL=C.UTF-8 MANROFFSEQ='' MANWIDTH=80 \
    man --warnings -E UTF-8 -l -Tutf8 -Z "$page" 2>&1 >/dev/null)
  if [ -n "$out" ]; then
    printf '%s: %s\n' "$page" "$out"
    status=1
  fi
done
exit $status
