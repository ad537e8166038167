"""Makes the reference of the public headers, which fails on undocumented names, and looks for what doxygen lets pass:
enumerators without a description.

usage: check_reference.py DOXYGEN DOXYFILE OUTPUT
"""
import os
import pathlib
import subprocess
import sys
import xml.etree.ElementTree

doxygen, doxyfile, output = sys.argv[1:]
subprocess.run([doxygen, doxyfile], check=True, env={**os.environ, "FLVDMX_DOCS": output, "FLVDMX_VERSION": ""})

count = 0
undocumented = []
for path in pathlib.Path(output, "xml").glob("*.xml"):
    for value in xml.etree.ElementTree.parse(path).iter("enumvalue"):
        count += 1
        texts = [value.find(tag) for tag in ("briefdescription", "detaileddescription")]
        if not any("".join(text.itertext()).strip() for text in texts):
            undocumented.append(value.findtext("name"))
assert count > 50, count  # there are enumerators to look at
assert not undocumented, undocumented
