"""usage: check_links.py SITE-DIRECTORY
Every link of a site leads to a page, and to a place in it, that is there."""

import html
import pathlib
import re
import sys
import urllib.parse

# What Doxygen links to and does not write: the nested classes of a class whose only ones are private.
UNWRITTEN = {"nested-classes"}


def main(site):
    pages = {page.name: page.read_text(errors="replace") for page in site.glob("*.html")}
    places = {name: set(re.findall(r'\b(?:id|name)="([^"]+)"', text)) | UNWRITTEN for name, text in pages.items()}
    dead = 0
    for name, text in pages.items():
        for link in set(re.findall(r'<a [^>]*?href="([^"]+)"', text)):
            target, _, place = urllib.parse.unquote(html.unescape(link)).partition("#")
            if re.match(r"[a-z]+:", link):
                continue
            target = target or name
            if not (site / target).exists() or (place and target in places and place not in places[target]):
                dead += 1
                print(f"{name} links to {link}, which is not there", file=sys.stderr)
    return 1 if dead or not pages else 0


sys.exit(main(pathlib.Path(sys.argv[1])))
