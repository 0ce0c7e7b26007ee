"""Parses a message file with Python's email package and describes it.

Usage: mime_check.py MESSAGE [ATTACHMENT_FILE ...]

Prints one line per finding, for the test to compare:
  header NAME: VALUE        every header line, in order
  text TYPE VALUE           the text of the message or of its first part,
                            with CR and LF written as \\r and \\n
  part TYPE NAME ENCODING SIZE SAME|DIFFERENT|UNCHECKED
                            every attachment part; SAME when its decoded bytes
                            equal the next ATTACHMENT_FILE given
  defect NAME               every defect the parser noticed
"""

import email
import email.policy
import sys


def escape(text):
    return text.replace("\\", "\\\\").replace("\r", "\\r").replace("\n", "\\n")


def describe(message_path, attachment_paths):
    with open(message_path, "rb") as f:
        # From bytes, not from the file object: the file reader would turn
        # every CR LF of the text into LF.
        message = email.message_from_bytes(f.read(), policy=email.policy.default)
    expected = list(attachment_paths)
    lines = ["header %s: %s" % (name, value) for name, value in message.items()]
    defects = list(message.defects)
    parts = list(message.iter_parts()) if message.is_multipart() else [message]
    for index, part in enumerate(parts):
        defects += part.defects if part is not message else []
        payload = part.get_payload(decode=True)
        if index == 0:
            lines.append("text %s %s" % (part.get_content_type(), escape(payload.decode("latin-1"))))
            continue
        verdict = "UNCHECKED"
        if expected:
            with open(expected.pop(0), "rb") as original:
                verdict = "SAME" if original.read() == payload else "DIFFERENT"
        lines.append("part %s %s %s %d %s" % (part.get_content_type(), part.get_filename(),
                                              part.get("Content-Transfer-Encoding"),
                                              len(payload), verdict))
    lines += ["defect %s" % type(d).__name__ for d in defects]
    return lines


if __name__ == "__main__":
    sys.stdout.write("".join(line + "\n" for line in describe(sys.argv[1], sys.argv[2:])))
