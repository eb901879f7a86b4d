#!/usr/bin/env python3
"""Writes the mapping files in encodings/ from published tables that this machine has.

    Resources/generate_encodings.py            writes every file whose source is here
    Resources/generate_encodings.py --check    compares instead; status 1 if a file is not current
    Resources/generate_encodings.py --to DIR   writes to another folder

A source that is missing is named on standard error and its files are left alone. Sources are Python's codecs, and by
way of Perl the modules Encode (package perl) and Unicode::Map (package libunicode-map-perl); two files are tables below.

A line is "0xCODE 0xCODEPOINT", with codes ascending. Codes that stand for more than one code point can't be written so.
What is only a mark for converting back (U+F850 to U+F8FF beside another character) is dropped from such a sequence; if
one code point is left that has no plain code of its own, it is written, otherwise the code is left out.
"""

import argparse
import codecs
import subprocess
import sys
import unicodedata
from pathlib import Path

FOLDER = Path(__file__).resolve().parent / "encodings"


class SourceMissing(Exception):
    pass


def all_codes():
    """Every single byte, and every pair that could be a double-byte code."""
    yield from range(0x100)
    for lead in range(0x80, 0x100):
        yield from range(lead << 8 | 0x20, (lead << 8) + 0x100)


def to_bytes(code):
    return bytes([code]) if code < 0x100 else bytes([code >> 8, code & 0xFF])


def from_python(name):
    """Python's codec, made from the tables on the Unicode Consortium's site (MAPPINGS/VENDORS)."""
    decode = codecs.lookup(name).decode
    rows, leads = {}, set()
    for code in all_codes():
        if code >> 8 and (code >> 8 in rows or not leads):
            continue  # The lead is a character of its own.
        try:
            rows[code] = decode(to_bytes(code), "strict")[0]
        except UnicodeDecodeError as error:
            if code < 0x100 and "incomplete" in error.reason:
                leads.add(code)
    return rows


PERL_ENCODE = """
use Encode; my $e = find_encoding($ARGV[0]) or exit 3;
for my $code (0 .. 0xFF, 0x8000 .. 0xFFFF) {
    my $lead = $code >> 8; next if $lead && $single{$lead};
    my $bytes = $code < 0x100 ? chr $code : pack("n", $code);
    my $text = eval { $e->decode($bytes, Encode::FB_CROAK) }; next unless defined $text && length $text;
    $single{$code} = 1 if $code < 0x100;
    print join(" ", map { sprintf "%X", $_ } $code, map { ord } split //, $text), "\\n";
}
"""

PERL_UNICODE_MAP = r"""
use Unicode::Map; (my $path = $INC{"Unicode/Map.pm"}) =~ s/\.pm$//;
# The register leaves out maps that have pairs behind single bytes, which are not wanted here: the map is named by file.
{ no warnings; *Unicode::Map::_mapping = sub { "$path/APPLE/$ARGV[0].map" }; }
my $map = Unicode::Map->new("APPLE-DEVANAGA") or exit 3;
for my $code (0 .. 0xFF) {
    my $text = $map->to_unicode(chr $code); next unless defined $text && length $text;
    print join(" ", map { sprintf "%X", $_ } $code, unpack("n*", $text)), "\n";
}
"""


def from_perl(script, name):
    try:
        done = subprocess.run(["perl", "-e", script, name], capture_output=True, text=True)
    except FileNotFoundError:
        raise SourceMissing("perl")
    if done.returncode:
        raise SourceMissing(f"a module of Perl for {name}")
    rows = {}
    for line in done.stdout.splitlines():
        code, *points = (int(word, 16) for word in line.split())
        rows[code] = "".join(map(chr, points))
    return rows


def from_perl_encode(name):
    """Perl's Encode, made from Apple's tables on the Unicode Consortium's site (MAPPINGS/VENDORS/APPLE)."""
    return from_perl(PERL_ENCODE, name)


def from_unicode_map(name):
    """Perl's Unicode::Map, made from the same. Single bytes only: the pairs in which a sign is followed by a nukta
    would make lead bytes of letters that stand alone elsewhere."""
    return from_perl(PERL_UNICODE_MAP, name)


def pdf_doc_encoding(_):
    """ISO 32000-1, annex D.2, column PDF."""
    rows = {code: chr(code) for code in [0x09, 0x0A, 0x0D, *range(0x20, 0x7F), *range(0xA1, 0x100)] if code != 0xAD}
    rows.update(zip(range(0x18, 0x20), "\u02D8\u02C7\u02C6\u02D9\u02DD\u02DB\u02DA\u02DC"))
    rows.update(zip(range(0x80, 0x9F), "\u2022\u2020\u2021\u2026\u2014\u2013\u0192\u2044\u2039\u203A\u2212\u2030"
                                       "\u201E\u201C\u201D\u2018\u2019\u201A\u2122\uFB01\uFB02\u0141\u0152\u0160\u0178"
                                       "\u017D\u0131\u0142\u0153\u0161\u017E"))
    rows[0xA0] = "\u20AC"
    return rows


def windows_symbol(_):
    """OpenType, table cmap, platform 3, encoding 0: symbols lie from U+F000 on."""
    return {code: chr(code if code < 0x20 else 0xF000 + code) for code in range(0x100)}


PYTHON, ENCODE, MAP = "Python codec", "Perl Encode", "Perl Unicode::Map"
READERS = {PYTHON: from_python, ENCODE: from_perl_encode, MAP: from_unicode_map,
           "ISO 32000-1, annex D.2": pdf_doc_encoding, "OpenType, cmap platform 3, encoding 0": windows_symbol}

# File, source, the encoding's name there.
FILES = [
    ("WinSymbol.txt", "OpenType, cmap platform 3, encoding 0", "symbol"),
    ("PdfDocEncoding.txt", "ISO 32000-1, annex D.2", "PDFDocEncoding"),
    *((f"CP{number}.txt", PYTHON, f"cp{number}")
      for number in (775, 874, 932, 949, 950, 1250, 1251, 1252, 1253, 1254, 1255, 1258)),
    ("Arabic.txt", PYTHON, "mac_arabic"),
    ("CentEuro.txt", PYTHON, "mac_latin2"),
    ("Croatian.txt", PYTHON, "mac_croatian"),
    ("Cyrillic.txt", PYTHON, "mac_cyrillic"),
    ("Farsi.txt", PYTHON, "mac_farsi"),
    ("Greek", PYTHON, "mac_greek"),
    ("Greek.txt", PYTHON, "mac_greek"),
    ("Iceland.txt", PYTHON, "mac_iceland"),
    ("Icelandic.txt", PYTHON, "mac_iceland"),
    ("Latin2.txt", PYTHON, "mac_latin2"),
    ("Roman.txt", PYTHON, "mac_roman"),
    ("Romanian.txt", PYTHON, "mac_romanian"),
    ("Turkish.txt", PYTHON, "mac_turkish"),
    ("ChinSimp.txt", ENCODE, "MacChineseSimp"),
    ("ChinTrad.txt", ENCODE, "MacChineseTrad"),
    ("Hebrew.txt", ENCODE, "MacHebrew"),
    ("Japanese.txt", ENCODE, "MacJapanese"),
    ("Korean.txt", ENCODE, "MacKorean"),
    ("MacSymbol.txt", ENCODE, "MacSymbol"),
    ("Thai.txt", ENCODE, "MacThai"),
    ("Devanagari.txt", MAP, "DEVANAGA"),
    ("Gujarati.txt", MAP, "GUJARATI"),
    ("Gurmukhi.txt", MAP, "GURMUKHI"),
]


def single_code_points(rows):
    """One code point for each code, by the rule at the top."""
    plain = {text for text in rows.values() if len(text) == 1}
    single = {}
    for code, text in sorted(rows.items()):
        if len(text) > 1:
            text = "".join(c for c in text if not 0xF850 <= ord(c) <= 0xF8FF)
            if len(text) != 1 or text in plain:
                continue
        if text != "\uFFFD" and not 0xD800 <= ord(text) <= 0xDFFF:
            single[code] = ord(text)
    return single


def make_file(source, name):
    lines = [f"# generated by Resources/generate_encodings.py from {source}: {name}"]
    for code, point in single_code_points(READERS[source](name)).items():
        # The names of a version that every Python has; double-byte tables would be twice as large with them.
        comment = unicodedata.ucd_3_2_0.name(chr(point), "") if code < 0x100 else ""
        lines.append(f"0x{code:0{2 if code < 0x100 else 4}X} 0x{point:04X}" + (f" # {comment}" if comment else ""))
    return "\n".join(lines) + "\n"


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--check", action="store_true")
    parser.add_argument("--to", type=Path, default=FOLDER)
    options = parser.parse_args()
    status = 0
    for file, source, name in FILES:
        try:
            text = make_file(source, name)
        except SourceMissing as missing:
            print(f"{file}: skipped, {missing} is not installed", file=sys.stderr)
            continue
        path = options.to / file
        if not options.check:
            path.write_text(text)
        elif not path.is_file() or path.read_text() != text:
            print(f"Resources/encodings/{file}: not what {source} gives; run Resources/generate_encodings.py")
            status = 1
    return status


if __name__ == "__main__":
    sys.exit(main())
