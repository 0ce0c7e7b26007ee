#!/usr/bin/python3
"""A real SMTP server for the tests, on aiosmtpd.

Listens on 127.0.0.1 (port 0 picks a free one), prints "PORT <n>" on standard
output once it accepts connections, and stores every message it accepts in
the output directory as <n>.eml (the bytes received) and <n>.env (envelope:
"from", "rcpt", "login" and "tls" lines). With --maildir it also delivers each
message into that Maildir, with Return-Path and Delivered-To lines in front as
a mail delivery agent writes them.
Modes: plain, starttls (STARTTLS required) and smtps (TLS from the start).
With --user and --password, AUTH is required. Runs until killed.
"""
import argparse
import asyncio
import logging
import mailbox
import os
import ssl
import sys
import warnings

from aiosmtpd.smtp import SMTP, AuthResult, LoginPassword


class Store:
    def __init__(self, directory, maildir=None):
        self.directory = directory
        self.maildir = mailbox.Maildir(maildir, create=True) if maildir else None
        # A server started again on the same directory numbers on after the
        # messages already there instead of overwriting them.
        self.count = 0
        while directory is not None and \
                os.path.exists(os.path.join(directory, "%d.eml" % (self.count + 1))):
            self.count += 1

    async def handle_DATA(self, server, session, envelope):
        self.count += 1
        if self.maildir is not None:
            trace = "Return-Path: <%s>\r\n" % envelope.mail_from
            trace += "".join("Delivered-To: %s\r\n" % rcpt for rcpt in envelope.rcpt_tos)
            self.maildir.add(trace.encode() + envelope.original_content)
        if self.directory is None:
            return "250 OK"
        base = os.path.join(self.directory, "%d" % self.count)
        with open(base + ".eml.tmp", "wb") as f:
            f.write(envelope.original_content)
        login = ""
        if session.authenticated and isinstance(session.auth_data, LoginPassword):
            login = session.auth_data.login.decode(errors="replace")
        tls = server.transport.get_extra_info("ssl_object") is not None
        with open(base + ".env", "w") as f:
            f.write("from %s\n" % envelope.mail_from)
            for rcpt in envelope.rcpt_tos:
                f.write("rcpt %s\n" % rcpt)
            f.write("login %s\n" % (login or ""))
            f.write("tls %d\n" % (1 if tls else 0))
        # The .eml appears last and whole, so a reader never sees half a message.
        os.rename(base + ".eml.tmp", base + ".eml")
        return "250 OK"


def make_authenticator(user, password):
    def authenticate(server, session, envelope, mechanism, auth_data):
        if isinstance(auth_data, LoginPassword) and auth_data.login == user.encode() \
                and auth_data.password == password.encode():
            return AuthResult(success=True, auth_data=auth_data)
        return AuthResult(success=False, handled=False)
    return authenticate


def tls_context(cert, key):
    context = ssl.create_default_context(ssl.Purpose.CLIENT_AUTH)
    context.load_cert_chain(cert, key)
    return context


def factory(args, handler):
    options = {"hostname": "alertmod-test"}
    if args.mode == "starttls":
        options["tls_context"] = tls_context(args.cert, args.key)
        options["require_starttls"] = True
    if args.user is not None:
        options["authenticator"] = make_authenticator(args.user, args.password)
        options["auth_required"] = True
        options["auth_require_tls"] = False
    return lambda: SMTP(handler, **options)


async def main(args):
    handler = Store(args.dir, args.maildir)
    ssl_context = tls_context(args.cert, args.key) if args.mode == "smtps" else None
    loop = asyncio.get_running_loop()
    server = await loop.create_server(factory(args, handler), "127.0.0.1", args.port,
                                      ssl=ssl_context, reuse_address=True)
    port = server.sockets[0].getsockname()[1]
    print("PORT %d" % port, flush=True)
    async with server:
        await server.serve_forever()


if __name__ == "__main__":
    # The tests require AUTH over plain connections on purpose.
    warnings.filterwarnings("ignore")
    logging.getLogger("mail.log").setLevel(logging.CRITICAL)
    parser = argparse.ArgumentParser()
    parser.add_argument("--dir")
    parser.add_argument("--maildir")
    parser.add_argument("--port", type=int, default=0)
    parser.add_argument("--mode", choices=["plain", "starttls", "smtps"], default="plain")
    parser.add_argument("--cert")
    parser.add_argument("--key")
    parser.add_argument("--user")
    parser.add_argument("--password")
    arguments = parser.parse_args()
    if arguments.dir is None and arguments.maildir is None:
        parser.error("give --dir, --maildir or both")
    try:
        asyncio.run(main(arguments))
    except KeyboardInterrupt:
        sys.exit(0)
