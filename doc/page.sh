#!/bin/sh
# page.sh LOWDOWN PAGE.N.md VERSION OUTPUT: turns a manual page from Markdown into roff.
set -eu
name=$(basename "$2" .md)
# The converter begins every section with a paragraph, and asks for a font that not every formatter has.
"$1" -s -Tman --out-no-smarty -mtitle="${name%.*}" -msection="${name##*.}" -msource="portd $3" \
  -mdate=2026-11-21 "$2" |
  sed -z -e 's/\n\.\(S[HS]\)\n\([^\n]*\)\n\.[LP]P\n/\n.\1\n\2\n/g' -e 's/\\f(CR/\\fB/g' -e 's/\\fC/\\fB/g' \
    >"$4"
