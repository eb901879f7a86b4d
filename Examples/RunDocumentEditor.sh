#!/bin/bash
# Drives the document editor as a person would and checks what it answers: RunDocumentEditor.sh EDITOR
set -euo pipefail
editor=$1
folder=$(mktemp -d)
trap 'rm -rf "$folder"' EXIT
expect() { # expect TEXT COMMAND...: the command succeeds and its output has the text
    local text=$1 out
    shift
    out=$("$@")
    grep -qF -- "$text" <<<"$out" || { echo "expected '$text' from: $*"; echo "got: $out"; exit 1; }
}
head -c 300000 /dev/urandom >"$folder/sea.raw"
head -c 200000 /dev/urandom >"$folder/hill.raw"
doc=$folder/trip.pages
expect "2 items written" "$editor" "$doc" add "The sea" "$folder/sea.raw"
expect "2 items written" "$editor" "$doc" add "A hill" "$folder/hill.raw"
expect "2 pages, 0 pictures in memory" "$editor" "$doc" list
expect "1 items written" "$editor" "$doc" rename 2 "A mountain"
expect "A mountain" "$editor" "$doc" list
expect "200000 bytes, 1 pictures in memory" "$editor" "$doc" show 2 "$folder/out.raw"
cmp "$folder/hill.raw" "$folder/out.raw"
expect "A hill" "$editor" "$doc" undo
expect "A mountain" "$editor" "$doc" list
if "$editor" "$doc" show 3 "$folder/none" 2>/dev/null; then echo "page 3 was shown"; exit 1; fi
if "$editor" "$folder/none" list 2>/dev/null; then echo "a missing document was listed"; exit 1; fi
echo "the document editor does what it says"
