#!/bin/bash
# usage: scripts/docs.sh
# Installs what is missing and builds the site: the documents, and the reference of the public headers. Every warning is an
# error: a link that leads nowhere, a parameter that does not exist. The site is then in build/docs/html/index.html.

. "$(dirname "$0")/lib.sh"
[ $# -eq 0 ] || usage 1

install_packages docs
site=$build_root/docs
rm -rf "$site"
mkdir -p "$site"
cd "$source_directory"
KIVVCS_VERSION=$(sed -n 's/^project(KivVcs VERSION \([0-9.]*\).*/\1/p' CMakeLists.txt)
export KIVVCS_VERSION KIVVCS_SITE=$site KIVVCS_SOURCE=$source_directory
quietly doxygen docs/Doxyfile || die "building the site failed"
python3 docs/check_links.py "$site/html" || die "the site has dead links"
printf 'The site is in %s\n' "$site/html/index.html"
