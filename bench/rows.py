"""The rows of the table that are about printing very many: four folders of the large tree, with and
without the index, beside programs that print the same of each file."""

import os
import shutil

FOLDERS = 4
# What --json tells, as far as find knows it.
FIND_JSON = ('{"path":"%p","real_path":"%p","name":"%f","type":"%y","size":%s,"owner":{"gid":%G,'
             '"group":"%g","uid":%U,"user":"%u"},"perm":{"mode":"%m"},"time":{"atime":%A@,'
             '"ctime":%C@,"mtime":%T@}}\\n')
# The same fields of the file alone; jq makes an object of each line.
FIND_FIELDS = "%p\\t%f\\t%y\\t%s\\t%u\\t%g\\t%m\\t%A@\\t%C@\\t%T@\\n"
JQ = ('split("\\t") | {path: .[0], name: .[1], type: .[2], size: .[3] | tonumber, user: .[4], '
      'group: .[5], mode: .[6], atime: .[7], ctime: .[8], mtime: .[9]}')


def comparisons(kind, ours, tree, fd):
    """`ours`: the words of a search, to which options, a pattern and folders are added."""
    folders = sorted(entry.path for entry in os.scandir(tree) if entry.is_dir())[:FOLDERS]
    yield f"{kind}rows: paths", {
        "ours": [*ours, "", *folders], "fd": [*fd, ".", *folders],
    }, {"fd": "≤ 1"}
    yield f"{kind}rows: -l", {
        "ours": [*ours, "-l", "", *folders], "find -ls": ["find", *folders, "-mindepth", "1", "-ls"],
    }, {"find -ls": "≤ 1"}
    find = ["find", *folders, "-mindepth", "1", "-printf"]
    peers = {"find -printf": [*find, FIND_JSON]}
    if shutil.which("jq"):
        peers["find and jq"] = ["sh", "-c", '"$@" | jq -Rc "$0"', JQ, *find, FIND_FIELDS]
    yield f"{kind}rows: --json", {"ours": [*ours, "--json", "", *folders], **peers}, {
        peer: "≤ 1" for peer in peers}
