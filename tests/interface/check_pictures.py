#!/usr/bin/env python3
"""The pictures that a page of Markdown shows are there, well-formed, small, and have a text for who does not see them.

    check_pictures.py PAGE

Each fault is a line of output and makes the check fail.
"""
import os
import re
import sys
import xml.etree.ElementTree

LARGEST = 100 * 1024


def faults_of(path, text):
    if not text.strip():
        yield "no alternative text"
    if not os.path.isfile(path):
        yield "is not there"
        return
    if os.path.getsize(path) > LARGEST:
        yield "is larger than {} bytes".format(LARGEST)
    try:
        root = xml.etree.ElementTree.parse(path).getroot()
    except xml.etree.ElementTree.ParseError as error:
        yield str(error)
        return
    if root.tag != "{http://www.w3.org/2000/svg}svg":
        yield "is no SVG"


def main():
    page = sys.argv[1]
    with open(page, encoding="utf-8") as file:
        pictures = re.findall(r"!\[([^\]]*)\]\(([^)]+)\)", file.read())
    faults = ["{}: {}".format(name, fault) for text, name in pictures
              for fault in faults_of(os.path.join(os.path.dirname(page), name), text)]
    if not pictures:
        faults = ["{} shows no pictures".format(page)]
    for fault in faults:
        print(fault)
    return 1 if faults else 0


sys.exit(main())
