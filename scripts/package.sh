#!/usr/bin/env bash
# Makes the release archive dist/sorvel-VERSION-win32.zip from the built
# product, then unpacks it and checks it: exactly sorvel.dll, GUIDE.txt,
# LICENSE and SHA256SUMS in one folder, the sums right, and the DLL byte for
# byte build/windows-x86/sorvel.dll (or, given a SHA-256 sum, the DLL with
# that sum: the one the tests ran). It builds nothing of the DLL; the guide
# comes from sorvel-guide of the native-plain preset, built when missing.
#   bash scripts/package.sh [DLL_SHA256]
set -euo pipefail
cd "$(dirname "$0")/.."
dll=build/windows-x86/sorvel.dll
if [ ! -f "$dll" ]; then
  echo "package: no $dll: cmake --preset windows-x86 && cmake --build --preset windows-x86" >&2
  exit 1
fi
version=$(sed -n 's/^project(sorvel VERSION \([0-9.]*\).*/\1/p' CMakeLists.txt)
name=sorvel-$version-win32
if [ ! -f build/native-plain/build.ninja ]; then
  cmake --preset native-plain >/dev/null
fi
cmake --build --preset native-plain --target sorvel-guide >/dev/null

stage=build/package
rm -rf "$stage"
mkdir -p "$stage/$name" dist
cp "$dll" LICENSE "$stage/$name/"
build/native-plain/sorvel-guide README.md "$version" "$stage/$name/GUIDE.txt"
(cd "$stage/$name" && sha256sum sorvel.dll GUIDE.txt LICENSE >SHA256SUMS)
rm -f "dist/$name.zip"
(cd "$stage" && cmake -E tar cf "../../dist/$name.zip" --format=zip "$name")

# The archive as a game developer gets it.
check=$stage/unpacked
mkdir -p "$check"
(cd "$check" && cmake -E tar xf "../../../dist/$name.zip")
found=$(cd "$check" && find . -type f | sort | tr '\n' ' ')
expected="./$name/GUIDE.txt ./$name/LICENSE ./$name/SHA256SUMS ./$name/sorvel.dll "
if [ "$found" != "$expected" ]; then
  echo "package: the archive holds $found, not $expected" >&2
  exit 1
fi
(cd "$check/$name" && sha256sum --quiet -c SHA256SUMS)
want=${1:-$(sha256sum "$dll" | cut -d' ' -f1)}
got=$(sha256sum "$check/$name/sorvel.dll" | cut -d' ' -f1)
if [ "$got" != "$want" ]; then
  echo "package: the archive's sorvel.dll ($got) is not the DLL that was tested ($want)" >&2
  exit 1
fi
grep -q "^Sorvel $version: " "$check/$name/GUIDE.txt"
echo "package: dist/$name.zip ($(wc -c <"dist/$name.zip") bytes): $found"
