#!/bin/sh
# The engine library must export exactly the native methods the Java host declares, and nothing
# else: every other symbol stays hidden so that it cannot clash with anything the JVM loads.
set -eu
library=$1
sources=$(cd "$(dirname "$0")/../../host/src/main/java" && pwd)
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
# Natives declared here whose exports are written at the same time on another branch count as
# exported until the library has them too: pending_exports.txt lists them.
grep -v '^#' "$(dirname "$0")/pending_exports.txt" >"$work/pending" || true
# Java_<package with _ for .>_<Class>_<method>: no host package, class or method has a '_'.
(cd "$sources" && grep -rlw native --include='*.java' .) | while read -r file; do
  class=$(printf '%s' "${file#./}" | sed 's/\.java$//; s#/#_#g')
  grep -o ' native [^(]*(' "$sources/$file" | sed 's/($//; s/.* //' |
    while read -r method; do echo "Java_${class}_${method}"; done
done >"$work/expected.unsorted"
# Natives whose Java class is not in the host sources yet (written at the same time on another
# branch): each counts until its class appears, and from then on only the class's own natives.
grep -v '^#' "$(dirname "$0")/pending_natives.txt" | while read -r symbol; do
  class=$(printf '%s' "${symbol#Java_}" | sed 's/_[^_]*$//; s#_#/#g')
  [ -f "$sources/$class.java" ] || echo "$symbol"
done >>"$work/expected.unsorted"
LC_ALL=C sort "$work/expected.unsorted" >"$work/expected"
nm -D --defined-only "$library" | awk 'NF == 3 { print $3 }' | LC_ALL=C sort >"$work/actual"
if [ ! -s "$work/expected" ] || ! LC_ALL=C sort -u "$work/actual" "$work/pending" | diff "$work/expected" -; then
  echo "the library's exports differ from the host's native methods (< missing, > unexpected)"
  exit 1
fi
echo "$(wc -l <"$work/actual") JNI exports, nothing else"
