"""Bundles: the workflows on the shared file system, and the service's descriptions of properties.

Between them they have every form that such files may have: XML and binary information files; tables of quoted text in
UTF-8 and UTF-16 and as XML and binary property lists; localizations named in English and by code.
"""

import plistlib

import library
import names
import settings

LOCALIZATIONS = "/System/Library/SorvaneProducer/SorvaneProducerServerLocalizations.bundle"


def quoted(text):
    return '"' + text.replace("\\", "\\\\").replace('"', '\\"') + '"'


def strings_table(entries, comment):
    lines = [f"/* {comment} */"] + [f"{quoted(key)} = {quoted(value)};" for key, value in entries.items()]
    return "\n".join(lines) + "\n"


# How the tables of a localization are written; others are quoted text in UTF-8. "utf-16" writes a byte-order mark.
ENCODINGS = {"French": "utf-16"}
PROPERTY_LISTS = {"ja": plistlib.FMT_XML, "fr": plistlib.FMT_BINARY}
BINARY_INFORMATION = ["AudioEpisode.workflow", "TwoCameras.workflow"]


def write_strings(root, bundle, language, table, entries):
    path = settings.below(root, f"{bundle}/Contents/Resources/{language}.lproj/{table}.strings")
    if language in PROPERTY_LISTS:
        path.write_bytes(plistlib.dumps(entries, fmt=PROPERTY_LISTS[language]))
    else:
        path.write_text(strings_table(entries, f"{table}, {language}"), encoding=ENCODINGS.get(language, "utf-8"))


def write(root, workflows):
    for directory, _, _, _, _, information, languages in workflows:
        if information is None:  # registered, but gone from the disk
            continue
        bundle = f"{settings.SHARED}/Workflows/{directory}"
        uuid = names.uuid_of("workflow", directory)
        form = plistlib.FMT_BINARY if directory in BINARY_INFORMATION else plistlib.FMT_XML
        settings.write_plist(root, bundle + "/Contents/Info.plist", dict(information, UUID=uuid), form)
        for language, (name, description) in languages.items():
            write_strings(root, bundle, language, "InfoPlist", {"Name": name, "Description": description})
    settings.write_plist(root, LOCALIZATIONS + "/Contents/Info.plist", {"Name": "Server localizations"})
    for language, entries in library.DESCRIPTIONS.items():
        write_strings(root, LOCALIZATIONS, language, "PropertyDescriptions", entries)
