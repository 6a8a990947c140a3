"""Bundles: the workflows on the shared file system, and the service's descriptions of properties."""

import library
import names
import settings

LOCALIZATIONS = "/System/Library/SorvaneProducer/SorvaneProducerServerLocalizations.bundle"


def quoted(text):
    return '"' + text.replace("\\", "\\\\").replace('"', '\\"') + '"'


def strings_table(entries, comment):
    lines = [f"/* {comment} */"] + [f"{quoted(key)} = {quoted(value)};" for key, value in entries.items()]
    return "\n".join(lines) + "\n"


def write_strings(root, bundle, language, table, entries, encoding="utf-8"):
    path = settings.below(root, f"{bundle}/Contents/Resources/{language}.lproj/{table}.strings")
    path.write_text(strings_table(entries, f"{table}, {language}"), encoding=encoding)


def write(root, workflows):
    for directory, _, _, _, _, information, languages in workflows:
        if information is None:  # registered, but gone from the disk
            continue
        bundle = f"{settings.SHARED}/Workflows/{directory}"
        uuid = names.uuid_of("workflow", directory)
        settings.write_plist(root, bundle + "/Contents/Info.plist", dict(information, UUID=uuid))
        for language, (name, description) in languages.items():
            write_strings(root, bundle, language, "InfoPlist", {"Name": name, "Description": description})
    settings.write_plist(root, LOCALIZATIONS + "/Contents/Info.plist", {"Name": "Server localizations"})
    for language, entries in library.DESCRIPTIONS.items():
        # One table has the other encoding that such tables may have ("utf-16" writes a byte-order mark).
        encoding = "utf-16" if language == "French" else "utf-8"
        write_strings(root, LOCALIZATIONS, language, "PropertyDescriptions", entries, encoding)
