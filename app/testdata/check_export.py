"""Reads an export back with Python's own readers and compares it with the
manifest of the store it came from. Prints every problem; exits 1 if any.

usage: check_export.py MANIFEST.json EXPORT_DIR eml|mbox|native

Every .eml goes through email (policy default), every MboxFile.mbx through
mailbox.mbox, every .vcf through vobject and every .ics through icalendar.
Items are matched by subject and the SHA-256 of their attachments.
"""
import collections
import email
import email.policy
import hashlib
import json
import mailbox
import os
import sys

# Python flags an encoded word inside a quoted file name, which RFC 2047
# forbids but mail programs write and read.
ACCEPTED_DEFECT = "encoded word inside quoted string"
CONTACTS = {"IPM.Contact", "IPF.Contact"}
APPOINTMENTS = {"IPM.Appointment", "IPF.Appointment", "IPM.Appointment.Private Calendar",
                "IPM.Schedule.Meeting.Request"}

problems = []


def signature(subject, shas):
    return (subject, tuple(sorted(shas)))


def read_message(msg, where):
    defects = [str(d) for part in msg.walk() for d in part.defects]
    defects = [d for d in defects if ACCEPTED_DEFECT not in d]
    if defects:
        problems.append("%s: defects %s" % (where, defects))
    if str(msg["x-priority"] or "") != "3 (Normal)":
        problems.append("%s: no X-Priority" % where)
    shas = []
    for part in msg.iter_attachments():
        if part.get_content_type() in ("text/vcard", "text/calendar"):
            continue  # the item itself, carried
        if part.get_filename() == "rtf-body.rtf":
            if part.get_content_type() != "application/rtf" or \
                    not (part.get_payload(decode=True) or b"").startswith(b"{\\rtf"):
                problems.append("%s: the RTF body part is not RTF" % where)
            continue
        shas.append(hashlib.sha256(part.get_payload(decode=True) or b"").hexdigest())
    return signature(str(msg["subject"] or ""), shas)


def main():
    manifest = json.load(open(sys.argv[1]))
    root, mode = sys.argv[2], sys.argv[3]
    want = collections.Counter()
    contacts = appointments = 0
    for folder in manifest["folders"]:
        if not folder["visible"]:
            continue
        for item in folder.get("items", []):
            if not item.get("in_msg_table", True):
                continue
            cls = item["class"] or "IPM.Note"
            if mode == "native" and cls in CONTACTS:
                contacts += 1
                continue
            if mode == "native" and cls in APPOINTMENTS:
                appointments += 1
                continue
            want[signature(item["subject"], [a["sha256"] for a in item["attachments"]])] += 1
    got = collections.Counter()
    vcf = ics = 0
    for folder, _, files in os.walk(root):
        for name in files:
            path = os.path.join(folder, name)
            if name.endswith(".part"):
                problems.append("%s: half-written file left behind" % path)
            elif name.endswith(".eml"):
                with open(path, "rb") as f:
                    got[read_message(email.message_from_bytes(f.read(), policy=email.policy.default), path)] += 1
            elif name == "MboxFile.mbx":
                box = mailbox.mbox(path, factory=lambda f: email.message_from_binary_file(f, policy=email.policy.default))
                for i, msg in enumerate(box):
                    got[read_message(msg, "%s #%d" % (path, i))] += 1
            elif name.endswith(".vcf"):
                import vobject
                with open(path, "rb") as f:
                    vobject.readOne(f.read().decode("utf-8"), allowQP=True)
                vcf += 1
            elif name.endswith(".ics"):
                import icalendar
                with open(path, "rb") as f:
                    icalendar.Calendar.from_ical(f.read())
                ics += 1
            else:
                problems.append("%s: unexpected file" % path)
    if got != want:
        for sig in (want - got):
            problems.append("missing: %r" % (sig,))
        for sig in (got - want):
            problems.append("unexpected: %r" % (sig,))
    if mode == "native" and (vcf, ics) != (contacts, appointments):
        problems.append("native files: %d vcf, %d ics; want %d, %d" % (vcf, ics, contacts, appointments))
    for p in problems:
        print(p)
    print("%d items checked" % sum(got.values()))
    sys.exit(1 if problems else 0)


main()
