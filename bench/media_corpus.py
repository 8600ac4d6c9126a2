"""Documents, mail, sound, pictures and video for the benchmark of the whole system, with texts of this machine in them."""
import email.message
import pathlib
import subprocess
import zipfile
from xml.sax.saxutils import escape

# Of a hundred files.
SHARES = (("pdf", 15), ("docx", 15), ("odt", 10), ("html", 15), ("eml", 10), ("rtf", 5), ("mp3", 10), ("flac", 5), ("jpg", 10), ("mp4", 5))
LINES = 60  # of a page


def pdf(path, text, title):
    lines = [line[:100].encode("latin-1", "replace").replace(b"\\", b"\\\\").replace(b"(", b"\\(").replace(b")", b"\\)")
             for line in text.splitlines()]
    pages = [lines[start:start + LINES] for start in range(0, len(lines) or 1, LINES)]
    kids = b" ".join(b"%d 0 R" % (5 + 2 * page) for page in range(len(pages)))
    objects = [b"<</Type/Catalog/Pages 2 0 R>>", b"<</Type/Pages/Count %d/Kids[%s]>>" % (len(pages), kids),
               b"<</Type/Font/Subtype/Type1/BaseFont/Helvetica>>", b"<</Title(%s)/Author(Bench Mark)>>" % title.encode()]
    for number, page in enumerate(pages):
        stream = b"BT /F 9 Tf 40 800 Td 12 TL " + b"".join(b"(%s) Tj T* " % line for line in page) + b"ET"
        objects.append(b"<</Type/Page/Parent 2 0 R/MediaBox[0 0 595 842]/Resources<</Font<</F 3 0 R>>>>/Contents %d 0 R>>" % (6 + 2 * number))
        objects.append(b"<</Length %d>>stream\n%s\nendstream" % (len(stream), stream))
    data, places = b"%PDF-1.4\n", []
    for number, item in enumerate(objects, 1):
        places.append(len(data))
        data += b"%d 0 obj%s endobj\n" % (number, item)
    table = b"".join(b"%010d 00000 n \n" % place for place in places)
    data += b"xref\n0 %d\n0000000000 65535 f \n%strailer<</Size %d/Root 1 0 R/Info 4 0 R>>\nstartxref\n%d\n%%%%EOF" % (
        len(objects) + 1, table, len(objects) + 1, len(data))
    path.write_bytes(data)


def zipped(path, members):
    with zipfile.ZipFile(path, "w", zipfile.ZIP_DEFLATED) as archive:
        for name, data in members:
            archive.writestr(name, data, zipfile.ZIP_STORED if name == "mimetype" else zipfile.ZIP_DEFLATED)


def docx(path, text, title):
    office = "http://schemas.openxmlformats.org/"
    body = "".join(f"<w:p><w:r><w:t>{escape(line)}</w:t></w:r></w:p>" for line in text.splitlines())
    zipped(path, (
        ("[Content_Types].xml", f'<Types xmlns="{office}package/2006/content-types"><Default Extension="xml" ContentType="application/xml"/>'
         '<Override PartName="/word/document.xml" ContentType="application/vnd.openxmlformats-officedocument.wordprocessingml.document.main+xml"/></Types>'),
        ("_rels/.rels", f'<Relationships xmlns="{office}package/2006/relationships"><Relationship Id="a" '
         f'Type="{office}officeDocument/2006/relationships/officeDocument" Target="word/document.xml"/></Relationships>'),
        ("word/document.xml", f'<w:document xmlns:w="{office}wordprocessingml/2006/main"><w:body>{body}</w:body></w:document>'),
        ("docProps/core.xml", f'<cp:coreProperties xmlns:cp="{office}package/2006/metadata/core-properties" '
         f'xmlns:dc="http://purl.org/dc/elements/1.1/"><dc:title>{escape(title)}</dc:title><dc:creator>Bench Mark</dc:creator></cp:coreProperties>')))


def odt(path, text, title):
    names = 'xmlns:office="urn:oasis:names:tc:opendocument:xmlns:office:1.0" xmlns:text="urn:oasis:names:tc:opendocument:xmlns:text:1.0" ' \
            'xmlns:dc="http://purl.org/dc/elements/1.1/"'
    body = "".join(f"<text:p>{escape(line)}</text:p>" for line in text.splitlines())
    zipped(path, (
        ("mimetype", "application/vnd.oasis.opendocument.text"),
        ("content.xml", f"<office:document-content {names}><office:body><office:text>{body}</office:text></office:body></office:document-content>"),
        ("meta.xml", f"<office:document-meta {names}><office:meta><dc:title>{escape(title)}</dc:title></office:meta></office:document-meta>")))


def html(path, text, title):
    body = "".join(f"<p>{escape(line)}</p>\n" for line in text.splitlines())
    path.write_text(f'<!DOCTYPE html><html><head><meta charset="utf-8"><title>{escape(title)}</title></head><body>{body}</body></html>')


def eml(path, text, title):
    message = email.message.EmailMessage()
    message["Subject"], message["From"], message["To"] = title, "Bench Mark <mark@example.org>", "all@example.org"
    message["Date"] = "Sat, 21 Nov 2026 12:00:00 +0000"
    message.set_content(text, charset="utf-8", cte="quoted-printable")
    path.write_bytes(message.as_bytes())


def rtf(path, text, title):
    safe = text.encode("ascii", "replace").decode().replace("\\", "\\\\").replace("{", "\\{").replace("}", "\\}")
    path.write_text("{\\rtf1\\ansi{\\info{\\title %s}}%s}" % (title, safe.replace("\n", "\\par\n")))


def ffmpeg(*arguments):
    subprocess.run(["ffmpeg", "-loglevel", "error", "-y", *map(str, arguments)], check=True, stdin=subprocess.DEVNULL)


class Media:
    """Sound, pictures and video: one of each kind is made, and copied with a title of its own."""

    def __init__(self, directory):
        directory.mkdir(parents=True, exist_ok=True)
        self.base = {kind: directory / f"base.{kind}" for kind in ("mp3", "flac", "mp4", "jpg")}
        for kind in ("mp3", "flac"):
            ffmpeg("-f", "lavfi", "-i", "sine=frequency=440:duration=20", self.base[kind])
        ffmpeg("-f", "lavfi", "-i", "testsrc=duration=5:size=640x360:rate=25", "-f", "lavfi", "-i", "sine=duration=5", self.base["mp4"])
        subprocess.run(["convert", "-size", "1600x1200", "-seed", "1", "plasma:fractal", "-blur", "0x4", self.base["jpg"]], check=True)

    def make(self, kind, path, title):
        if kind != "jpg":
            return ffmpeg("-i", self.base[kind], "-c", "copy", "-metadata", f"title={title}", "-metadata", "artist=Bench Mark", path)
        path.write_bytes(self.base[kind].read_bytes())
        subprocess.run(["exiv2", "-M", f"set Exif.Image.ImageDescription Ascii {title}", "-M", "set Exif.Image.Make Ascii Bench", path],
                       check=True, capture_output=True)


def make(directory, files, texts):
    """`texts` gives the documents' contents, one for each. Returns how many files and bytes there are."""
    kinds = [kind for kind, share in SHARES for _ in range(files * share // 100)]
    media = Media(directory.parent / "media_base")
    writers = {"pdf": pdf, "docx": docx, "odt": odt, "html": html, "eml": eml, "rtf": rtf}
    for number, kind in enumerate(kinds):
        path = pathlib.Path(directory) / kind / f"{number % 10}" / f"item{number}.{kind}"
        path.parent.mkdir(parents=True, exist_ok=True)
        title = f"{kind} number {number}"
        if kind in writers:
            printable = "".join(c if c.isprintable() or c == "\n" else " " for c in next(texts)[:40000])
            writers[kind](path, printable, title)
        else:
            media.make(kind, path, title)
    return len(kinds), sum(path.stat().st_size for path in directory.rglob("*") if path.is_file())
