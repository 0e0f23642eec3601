"""Handler for the loopback SMTP server of the end-to-end tests.

Run as:  python3 -m aiosmtpd -n -l 127.0.0.1:PORT -c smtp_sink.Sink DIRECTORY
(with this folder on PYTHONPATH). Every message received becomes files in
DIRECTORY, all named msgNNN.<part>:
  .from  the envelope sender       .to    the envelope receivers, one a line
  .subject, .text                  the Subject header and the text part
  .name  the attachment's file name .att  the attachment's bytes, decoded
  .eml   the message as received
The .eml file is written last (renamed into place), so its presence means
the message is complete.
"""

import email
import email.policy
import itertools
import os


class Sink:
    def __init__(self, directory):
        self.directory = directory
        self.numbers = itertools.count(1)

    @classmethod
    def from_cli(cls, parser, *args):
        if len(args) != 1:
            parser.error("smtp_sink.Sink takes the directory for the messages")
        return cls(args[0])

    def _write(self, stem, part, data):
        if isinstance(data, str):
            data = data.encode("utf-8")
        with open(stem + part, "wb") as f:
            f.write(data)

    async def handle_DATA(self, server, session, envelope):
        stem = os.path.join(self.directory, "msg%03d" % next(self.numbers))
        raw = envelope.original_content or envelope.content
        message = email.message_from_bytes(raw, policy=email.policy.default)
        self._write(stem, ".from", envelope.mail_from)
        self._write(stem, ".to", "\n".join(envelope.rcpt_tos))
        self._write(stem, ".subject", str(message.get("Subject", "")))
        text = message.get_body(preferencelist=("plain",))
        self._write(stem, ".text", text.get_content() if text is not None else "")
        for attachment in message.iter_attachments():
            self._write(stem, ".name", attachment.get_filename() or "")
            self._write(stem, ".att", attachment.get_payload(decode=True))
            break
        self._write(stem, ".eml.part", raw)
        os.rename(stem + ".eml.part", stem + ".eml")
        return "250 Message accepted for delivery"
