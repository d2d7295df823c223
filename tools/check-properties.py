#!/usr/bin/env python3
"""Every property is read through its entry of config/PropertyTable.cpp, which also gives the
host its list of known keys for the misspelt-key warning. Fails when a source names a key as a
whole string that the table lacks (a read by hand, or a table that lost an entry), when a source
outside config/ calls the property port itself (but the host platform, a layer below the table,
which reads its own keys), or when an entry of the table is read by nothing."""
import pathlib
import re
import sys

top = pathlib.Path(__file__).resolve().parent.parent
key = re.compile(r'"((?:kv\.orvex|orvex\.host|ro\.board|kelvo\.build)\.[A-Za-z0-9_.]+)"')
entry = re.compile(r'\{P::(k[A-Za-z0-9]+),\s*"([^"]+)"')
table_file = top / "config/PropertyTable.cpp"
table_header = top / "config/PropertyTable.h"
table = dict((k, ident) for ident, k in entry.findall(table_file.read_text()))
if not table:
    print("check-properties: no entries found in %s" % table_file.relative_to(top))
    sys.exit(1)

named = {}  # key -> the first file that names it
used = set()  # Property identifiers read outside the table
by_hand = re.compile(r"(?:Properties\(\)\s*\.|properties->|properties\.)\s*(?:Get|Lookup)\s*\(")
by_hand_files = []
sources = []
# Every folder of the service's sources, whatever the layers are called; not the tests, tools,
# benchmarks or build trees.
skipped = {"bench", "cmake", "docs", "tests", "tools"}
for folder in sorted(top.iterdir()):
    if not folder.is_dir() or folder.name in skipped or folder.name.startswith((".", "build")):
        continue
    sources += [p for p in folder.rglob("*.[ch]*") if p.suffix in (".cpp", ".h")]
for path in sources:
    if path in (table_file, table_header):
        continue
    text = path.read_text(errors="replace")
    for k in key.findall(text):
        named.setdefault(k, path.relative_to(top))
    used |= set(re.findall(r"Property::(k[A-Za-z0-9]+)", text))
    if by_hand.search(text) and path.relative_to(top).parts[0] != "config" and \
            path.relative_to(top).parts[:2] != ("platform", "host"):
        by_hand_files.append(path.relative_to(top))

problems = 0
for k in sorted(set(named) - set(table)):
    problems += 1
    print("check-properties: %s (in %s) is not in %s" % (k, named[k], table_file.relative_to(top)))
for path in by_hand_files:
    problems += 1
    print("check-properties: %s reads the property port itself; read through config/" % path)
for k, ident in sorted(table.items()):
    if ident not in used and k not in named:
        problems += 1
        print("check-properties: %s (Property::%s) is in the table but nothing reads it" % (k, ident))
print("check-properties: %d keys in the table, %d problems" % (len(table), problems))
sys.exit(1 if problems else 0)
