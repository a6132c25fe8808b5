#!/bin/bash
# usage: scripts/js.sh
# Installs what is missing, builds the JavaScript module and packs it: build/js/kivvcs-VERSION.tgz. Then installs this tarball
# in a project of its own and tests it there: the tests of bindings/js/test in node, and the declarations by TypeScript.

. "$(dirname "$0")/lib.sh"
[ $# -eq 0 ] || usage 1

install_packages wasm
command -v npm >/dev/null || die "npm is missing, which comes with node"
build_preset js
module=$build_directory/bindings/js
tarball=$build_directory/$(cd "$module" && npm pack --silent --pack-destination "$build_directory")

consumer=$build_directory/consumer
rm -rf "$consumer"
mkdir -p "$consumer"
cp "$source_directory"/bindings/js/test/* "$consumer"
cd "$consumer"
echo '{"private": true, "type": "module"}' >package.json
quietly npm install --silent --no-audit --no-fund "$tarball" typescript@5
node --expose-gc --test ./*.test.js >test.log || { cat test.log && die "the tests of the package failed"; }
grep -E '^# (pass|fail) ' test.log
node_modules/.bin/tsc --noEmit --strict --target es2022 --module nodenext --lib es2022,dom,esnext.disposable consumer.ts
printf '%s: %d bytes; kivvcs.wasm: %d bytes, %d compressed\n' "$(basename "$tarball")" "$(stat -c %s "$tarball")" \
    "$(stat -c %s "$module/kivvcs.wasm")" "$(gzip -9 <"$module/kivvcs.wasm" | wc -c)"
