"""Reads PST files back with two independent readers (pffexport of pff-tools
and readpst of pst-utils) and compares what they find with the manifest of
the store the files were exported from. Prints every problem; exits 1 if any.

usage: check_pst.py MANIFEST.json WORK_DIR PST [PST ...]

Every visible folder of the manifest must appear (by its path of names) in
the files; mail-like items (mail, posts, notes, journal entries, tasks,
distribution lists) are matched by subject and the SHA-256 of their
attachments; contacts, appointments, tasks, sticky notes and journal
entries must sit in the default folder of their kind; plain bodies, HTML
and RTF bodies and the To names must come through pffexport.
`pffinfo` must read every file.
"""
import collections
import email
import email.policy
import hashlib
import json
import os
import re
import subprocess
import sys

CONTACTS = {"IPM.Contact", "IPF.Contact"}
# readpst writes these as .ics; a meeting request comes out as a message.
APPOINTMENTS = {"IPM.Appointment", "IPF.Appointment", "IPM.Appointment.Private Calendar"}
# Neither reader knows plain posts; the job's test counts them with Tarnwell's
# own reader.
POSTS = {"IPM.Post", "IPF.Post"}
# readpst leaves out tasks, journal entries, sticky notes and distribution lists.
NOT_BY_READPST = {"IPM.DistList", "IPF.DistList", "IPM.Task", "IPF.Task", "IPM.Activity",
                  "IPF.Activity", "IPM.StickyNote", "IPF.StickyNote"}
DEFAULT_FOLDER = {"IPM.Contact": "Contacts", "IPF.Contact": "Contacts", "IPM.Task": "Tasks",
                  "IPF.Task": "Tasks", "IPM.StickyNote": "Notes", "IPF.StickyNote": "Notes",
                  "IPM.Activity": "Journal", "IPF.Activity": "Journal"}
for c in APPOINTMENTS | {"IPM.Schedule.Meeting.Request"}:
    DEFAULT_FOLDER[c] = "Calendar"
ITEM_DIR = re.compile(r"^[A-Za-z]+\d{5}$")

problems = []


def sha(data):
    return hashlib.sha256(data).hexdigest()


def bmp(text):
    """pff-tools 20180714 mangles characters beyond U+FFFF (surrogate pairs)
    and readpst drops them: compare texts without them."""
    return " ".join("".join(c for c in text if ord(c) <= 0xFFFF).split())


def signature(cls, subject, shas):
    if cls in CONTACTS:
        subject = "<contact>"
    return (bmp(subject), tuple(sorted(shas)))


def normal(text):
    return " ".join(text.replace("\x00", "").split())


def expected(manifest):
    """The visible folders and their items. A public store's root stands for
    the whole store, as a database's path does for a private one: the files
    hold the folders below it."""
    items = []
    folders = []
    for folder in manifest["folders"]:
        if not folder["visible"]:
            continue
        if manifest.get("public_store"):
            folder = dict(folder, path=folder["path"][1:])
            if not folder["path"]:
                continue
        folders.append(folder["path"])
        for item in folder.get("items", []):
            if item.get("in_msg_table", True):
                items.append((folder, item))
    return folders, items


def read_text(path):
    with open(path, "rb") as f:
        data = f.read()
    for bom, codec in ((b"\xef\xbb\xbf", "utf-8"), (b"\xff\xfe", "utf-16-le")):
        if data.startswith(bom):
            return data[len(bom):].decode(codec, "replace")
    return data.decode("utf-8", "replace")


def pff_items(pst, out):
    """Items pffexport finds: (folder path, kind, subject, shas, item dir)."""
    subprocess.run(["pffexport", "-q", "-m", "all", "-f", "all", "-t", out, pst],
                   stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, check=False)
    root = out + ".export"
    if not os.path.isdir(root):
        problems.append("%s: pffexport wrote nothing" % pst)
        return [], set()
    items, folders = [], set()
    for here, dirs, files in os.walk(root):
        rel = os.path.relpath(here, root)
        parts = [] if rel == "." else rel.split(os.sep)
        if "Attachments" in parts:
            dirs[:] = []
            continue
        if parts and ITEM_DIR.match(parts[-1]):
            dirs[:] = [d for d in dirs if d == "Attachments"]
            kind = re.sub(r"\d+$", "", parts[-1])
            headers = ""
            for name in ("OutlookHeaders.txt", kind + ".txt"):
                if name in files:
                    headers += read_text(os.path.join(here, name))
            m = re.search(r"^Subject:\t+(.*)$", headers, re.M)
            shas = []
            att = os.path.join(here, "Attachments")
            if os.path.isdir(att):
                for name in sorted(os.listdir(att)):
                    p = os.path.join(att, name)
                    if os.path.isfile(p):
                        with open(p, "rb") as f:
                            shas.append(sha(f.read()))
            items.append((tuple(parts[:-1]), kind, m.group(1) if m else "", shas, here))
        else:
            folders.add(tuple(parts))
    return items, folders


def readpst_items(pst, out):
    """Items readpst finds: mail-like signatures, and counts of .vcf/.ics."""
    os.makedirs(out, exist_ok=True)
    # One job: readpst's parallel jobs can still be writing when it returns.
    r = subprocess.run(["readpst", "-q", "-D", "-j", "0", "-e", "-o", out, pst], stdout=subprocess.DEVNULL,
                       stderr=subprocess.PIPE, check=False)
    if r.returncode != 0:
        problems.append("%s: readpst failed: %s" % (pst, r.stderr.decode(errors="replace")))
    mails = collections.Counter()
    vcf = ics = 0
    for here, _, files in os.walk(out):
        for name in files:
            path = os.path.join(here, name)
            if name.endswith(".vcf"):
                vcf += 1
            elif name.endswith(".ics"):
                ics += 1
            elif name.endswith(".eml"):
                with open(path, "rb") as f:
                    msg = email.message_from_bytes(f.read(), policy=email.policy.default)
                shas = []
                for part in msg.walk():
                    if part.is_multipart() or part.get_content_disposition() != "attachment":
                        continue
                    # readpst adds a meeting's iCalendar form itself.
                    if part.get_filename() == "rtf-body.rtf" or \
                            part.get_content_type() == "text/calendar":
                        continue
                    shas.append(sha(part.get_payload(decode=True) or b""))
                mails[signature("", str(msg["subject"] or ""), shas)] += 1
    return mails, vcf, ics


def ends_with(path, tail):
    path = [bmp(p) for p in path]
    tail = [bmp(p) for p in tail]
    return len(path) >= len(tail) and path[len(path) - len(tail):] == tail


def main():
    manifest = json.load(open(sys.argv[1]))
    work, psts = sys.argv[2], sys.argv[3:]
    want_folders, want_items = expected(manifest)
    all_pff, all_folders = [], set()
    rp_mail = collections.Counter()
    rp_vcf = rp_ics = 0
    for i, pst in enumerate(psts):
        r = subprocess.run(["pffinfo", pst], stdout=subprocess.PIPE, stderr=subprocess.PIPE)
        if r.returncode != 0:
            problems.append("%s: pffinfo failed: %s" % (pst, r.stderr.decode(errors="replace")))
        items, folders = pff_items(pst, os.path.join(work, "pff%d" % i))
        all_pff += items
        all_folders |= folders
        mails, vcf, ics = readpst_items(pst, os.path.join(work, "readpst%d" % i))
        rp_mail += mails
        rp_vcf += vcf
        rp_ics += ics

    # Every visible folder, by its path of names, in some file.
    for path in want_folders:
        if not any(ends_with(f, path) for f in all_folders | {p for p, *_ in all_pff}):
            problems.append("folder missing: %s" % "/".join(path))

    # Items: signatures with both readers, placement, bodies.
    want = collections.Counter()
    want_rp = collections.Counter()
    contacts = appointments = 0
    for folder, item in want_items:
        cls = item["class"] or "IPM.Note"
        if cls in POSTS:
            continue
        sig = signature(cls, item["subject"], [a["sha256"] for a in item["attachments"]])
        want[sig] += 1
        if cls in CONTACTS:
            contacts += 1
        elif cls in APPOINTMENTS:
            appointments += 1
        elif cls not in NOT_BY_READPST:
            want_rp[sig] += 1
    got = collections.Counter()
    by_sig = collections.defaultdict(list)
    for path, kind, subject, shas, where in all_pff:
        cls = "IPM.Contact" if kind == "Contact" else ""
        sig = signature(cls, subject, shas)
        got[sig] += 1
        by_sig[sig].append((path, where))
    for sig in want - got:
        problems.append("pffexport: missing %r" % (sig,))
    for sig in got - want:
        problems.append("pffexport: unexpected %r" % (sig,))
    # readpst writes appointments as .ics and contacts as .vcf; it leaves out
    # distribution lists.
    for sig in want_rp - rp_mail:
        problems.append("readpst: missing %r" % (sig,))
    for sig in rp_mail - want_rp:
        problems.append("readpst: unexpected %r" % (sig,))
    if (rp_vcf, rp_ics) != (contacts, appointments):
        problems.append("readpst: %d vcf, %d ics; want %d, %d" % (rp_vcf, rp_ics, contacts,
                                                                  appointments))

    for folder, item in want_items:
        cls = item["class"] or "IPM.Note"
        sig = signature(cls, item["subject"], [a["sha256"] for a in item["attachments"]])
        places = by_sig.get(sig, [])
        if not places or cls in POSTS:
            continue
        home = DEFAULT_FOLDER.get(cls)
        if home and not any(p and p[-1] == home for p, _ in places):
            problems.append("%r is not in the default %s folder: %r" % (sig, home, places))
        if not home and not any(ends_with(p, folder["path"]) for p, _ in places):
            problems.append("%r is not in %s: %r" % (sig, "/".join(folder["path"]), places))
        where = next((w for p, w in places if ends_with(p, folder["path"])), places[0][1])
        if cls in CONTACTS or cls in APPOINTMENTS or cls == "IPM.Schedule.Meeting.Request":
            continue
        body = bmp(item.get("body_text", ""))
        if body:
            text = os.path.join(where, "Message.txt")
            if not os.path.exists(text) or body not in bmp(read_text(text)):
                problems.append("%s: plain body missing" % where)
        if item.get("body_html") and not os.path.exists(os.path.join(where, "Message.html")):
            problems.append("%s: HTML body missing" % where)
        if item.get("rtf_text") and not os.path.exists(os.path.join(where, "Message.rtf")):
            problems.append("%s: RTF body missing" % where)
        recipients = os.path.join(where, "Recipients.txt")
        listed = normal(read_text(recipients)) if os.path.exists(recipients) else ""
        for to in (item.get("to_shown") or "").split(";"):
            to = normal(to)
            if to and to not in listed:
                problems.append("%s: recipient %r missing" % (where, to))

    for p in problems:
        print(p)
    print("%d items checked in %d files" % (sum(got.values()), len(psts)))
    sys.exit(1 if problems else 0)


main()
