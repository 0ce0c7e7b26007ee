#!/usr/bin/python3
"""Splits a received message into its parts for the tests.

Usage: mail_parts.py MESSAGE OUTDIR
Writes the text part to OUTDIR/body.txt and every attachment to
OUTDIR/<its file name>, and prints "subject <text>" and one
"attachment <file name> <content type> <bytes>" line per attachment.
"""
import email
import email.policy
import os
import sys


def main(message_path, out_dir):
    with open(message_path, "rb") as f:
        message = email.message_from_binary_file(f, policy=email.policy.compat32)
    print("subject %s" % message.get("Subject", ""))
    body = b""
    for part in message.walk():
        if part.is_multipart():
            continue
        name = part.get_filename()
        payload = part.get_payload(decode=True) or b""
        if name is None:
            body += payload
            continue
        with open(os.path.join(out_dir, name), "wb") as f:
            f.write(payload)
        print("attachment %s %s %d" % (name, part.get_content_type(), len(payload)))
    with open(os.path.join(out_dir, "body.txt"), "wb") as f:
        f.write(body)


if __name__ == "__main__":
    main(sys.argv[1], sys.argv[2])
