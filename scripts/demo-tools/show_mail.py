#!/usr/bin/python3
"""Shows what the demo's SMTP server received.

For each message in the Maildir, oldest first: where its file is, its subject,
sender, recipients (header and envelope), its body, the search that its web
link carries, and its attachments. Attachments are saved under --out; for a
video clip ffprobe describes it and ffmpeg makes a contact sheet (a PNG of one
frame per second) so that a person can see what was sent. Exits 1 when fewer
than --expect messages arrived or a clip cannot be read.
"""
import argparse
import base64
import binascii
import email
import email.policy
import json
import math
import os
import re
import subprocess
import sys

LINK = re.compile(r"http://\S+/advanced\.web\?\S+")
VIDEO_SUFFIXES = (".mov", ".mp4")


def message_files(maildir):
    files = []
    for folder in ("new", "cur"):
        directory = os.path.join(maildir, folder)
        if os.path.isdir(directory):
            files += [os.path.join(directory, name) for name in os.listdir(directory)]
    return sorted(files, key=lambda path: (os.path.getmtime(path), path))


def link_search(link):
    """The search request in a link's fragment, decoded from Base64."""
    fragment = link.partition("#")[2]
    try:
        return json.loads(base64.b64decode(fragment, validate=True))
    except (binascii.Error, ValueError):
        return None


def describe_clip(path):
    """(seconds, description) of a clip, or None when ffprobe cannot read it."""
    command = ["ffprobe", "-v", "error", "-select_streams", "v:0", "-count_frames",
               "-show_entries", "stream=codec_name,width,height,nb_read_frames:format=duration",
               "-of", "json", path]
    result = subprocess.run(command, capture_output=True, text=True)
    if result.returncode != 0:
        return None
    info = json.loads(result.stdout)
    stream = info["streams"][0]
    seconds = float(info["format"].get("duration", 0))
    return seconds, "%s %sx%s, %s frames, %.1f s" % (
        stream["codec_name"], stream["width"], stream["height"],
        stream.get("nb_read_frames", "?"), seconds)


def contact_sheet(clip, seconds, png):
    """One frame a second, four to a row."""
    frames = max(1, math.ceil(seconds))
    columns = min(frames, 4)
    rows = math.ceil(frames / columns)
    command = ["ffmpeg", "-v", "error", "-y", "-i", clip, "-vf",
               "fps=1,scale=320:-1,tile=%dx%d:padding=4:margin=4" % (columns, rows),
               "-frames:v", "1", png]
    return subprocess.run(command).returncode == 0 and os.path.exists(png)


def show_attachment(number, index, part, out):
    """Saves one attachment and describes it; False when a clip is unreadable."""
    name = part.get_filename() or "attachment-%d" % index
    data = part.get_payload(decode=True) or b""
    saved = os.path.join(out, "%d-%s" % (number, os.path.basename(name)))
    with open(saved, "wb") as f:
        f.write(data)
    print("    %s (%s, %d KB) saved as %s" % (name, part.get_content_type(), len(data) // 1024,
                                               saved))
    if not name.lower().endswith(VIDEO_SUFFIXES):
        return True
    described = describe_clip(saved)
    if described is None:
        print("      the clip cannot be read")
        return False
    seconds, description = described
    print("      clip: %s" % description)
    sheet = os.path.splitext(saved)[0] + "-contact-sheet.png"
    if contact_sheet(saved, seconds, sheet):
        print("      contact sheet: %s" % sheet)
    return True


def show_message(number, path, out):
    with open(path, "rb") as f:
        message = email.message_from_binary_file(f, policy=email.policy.default)
    print("E-mail %d: %s" % (number, path))
    for header in ("Subject", "From", "To", "Cc"):
        if message[header] is not None:
            print("  %-8s %s" % (header + ":", message[header]))
    print("  Envelope: %s" % ", ".join(message.get_all("Delivered-To", [])))
    body = message.get_body(preferencelist=("plain",))
    text = body.get_content() if body is not None else ""
    print("  Body:")
    for line in text.strip().splitlines():
        print("    | " + line)
    for link in LINK.findall(text):
        print("  Web link: %s" % link)
        print("    search: %s" % json.dumps(link_search(link)))
    attachments = list(message.iter_attachments())
    print("  Attachments: %d" % len(attachments))
    ok = True
    for index, part in enumerate(attachments, 1):
        ok = show_attachment(number, index, part, out) and ok
    return ok


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("--maildir", required=True)
    parser.add_argument("--out", required=True)
    parser.add_argument("--expect", type=int, default=0)
    args = parser.parse_args()
    os.makedirs(args.out, exist_ok=True)
    files = message_files(args.maildir)
    ok = True
    for number, path in enumerate(files, 1):
        print()
        ok = show_message(number, path, args.out) and ok
    if len(files) < args.expect:
        print("\nOnly %d of the %d expected e-mails arrived." % (len(files), args.expect),
              file=sys.stderr)
        return 1
    return 0 if ok else 1


if __name__ == "__main__":
    sys.exit(main())
