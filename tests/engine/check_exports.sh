#!/bin/sh
# The engine library must export exactly the native methods the Java host declares, and nothing
# else: every other symbol stays hidden so that it cannot clash with anything the JVM loads.
set -eu
library=$1
sources=$(cd "$(dirname "$0")/../../host/src/main/java" && pwd)
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
# Java_<package with _ for .>_<Class>_<method>: no host package, class or method has a '_'.
(cd "$sources" && grep -rlw native --include='*.java' .) | while read -r file; do
  class=$(printf '%s' "${file#./}" | sed 's/\.java$//; s#/#_#g')
  grep -o ' native [^(]*(' "$sources/$file" | sed 's/($//; s/.* //' |
    while read -r method; do echo "Java_${class}_${method}"; done
done | LC_ALL=C sort >"$work/expected"
nm -D --defined-only "$library" | awk 'NF == 3 { print $3 }' | LC_ALL=C sort >"$work/actual"
if [ ! -s "$work/expected" ] || ! diff "$work/expected" "$work/actual"; then
  echo "the library's exports differ from the host's native methods (< missing, > unexpected)"
  exit 1
fi
echo "$(wc -l <"$work/actual") JNI exports, nothing else"
