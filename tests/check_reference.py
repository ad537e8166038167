"""Makes the reference of the public headers, which fails on undocumented names, and finds what doxygen does not report:
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

values = [value for path in pathlib.Path(output, "xml").glob("*.xml")
          for value in xml.etree.ElementTree.parse(path).iter("enumvalue")]
assert len(values) > 50, len(values)  # the headers were read
undocumented = [value.findtext("name") for value in values if not any(
    "".join(value.find(tag).itertext()).strip() for tag in ("briefdescription", "detaileddescription"))]
assert not undocumented, undocumented
