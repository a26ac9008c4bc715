#!/usr/bin/env python3
"""What lies in an image: files by size, dates, what the checker says, and a note attached to the
root folder in memory. Cells begin with # %%, for editors that run a file piece by piece.

usage: catalog.py IMAGE"""

# %% Open the image; nothing is written to it.
import sys

import treehfs

volume = treehfs.open(sys.argv[1], overlay=True)
print("files:", volume.info.file_count, "folders:", volume.info.folder_count,
      "flags:", ", ".join(sorted(volume.info.flags)) or "none")

# %% Everything in the root folder.
for record in volume.listdir("/"):
    print(f"{record.kind:8} {record.id:4} {record.name}")

# %% The largest files of the volume.
files = [record for record in volume.records("catalog") if record.kind == "file"]
for record in sorted(files, key=lambda file: file.get("size", 0), reverse=True)[:3]:
    print(f"{record.get('size', 0):8} bytes  {record.key}  {record.modified or 'no date'}")

# %% Is it sound?
result = volume.check(full=True)
print("sound" if result.is_sound else "not sound", f"({result.nodes} nodes)")
for finding in result.findings:
    print(f"{finding.severity} {finding.id} {finding.text}")

# %% Changes belong together, or do not happen at all.
if "attributes" in volume.trees:
    with volume.transaction():
        volume.insert('2:"note"', 'inline{"seen"}', tree="attributes")
    print(volume.find('2:"note"', tree="attributes")["text"])

volume.close()
