#!/bin/bash
# usage: scripts/browser.sh [RELOADS]
# Installs what is missing, builds the JavaScript module, puts it beside examples/browser in build/js/site, and uses that page
# in headless Chromium, where it is reloaded 200 times, or RELOADS times. Pictures of it are then in build/js/screenshots.

. "$(dirname "$0")/lib.sh"
[ $# -le 1 ] || usage 1

install_packages wasm browser
command -v npm >/dev/null || die "npm is missing, which comes with node"
build_preset js
site=$build_directory/site
driver=$build_directory/driver
screenshots=$build_directory/screenshots
rm -rf "$site" "$screenshots"
mkdir -p "$site" "$driver" "$screenshots"
cp "$source_directory"/examples/browser/*.* "$build_directory"/bindings/js/kivvcs.{js,wasm} "$site"
cp "$source_directory/examples/browser/test/drive.js" "$driver"
cd "$driver"
echo '{"private": true, "type": "module"}' >package.json
quietly npm install --silent --no-audit --no-fund playwright-core@1
node drive.js "$site" "$screenshots" "$@"
