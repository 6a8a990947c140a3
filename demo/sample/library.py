"""The contents of the sample library: cameras, workflows and properties with their texts."""

# name, recording status, disabled, access control, access list, last user of the camera
CAMERAS = [
    ("Main hall", "capturing", None, "t", ["group:lecturers", "user:anna"], "anna"),
    ("Lecture hall 1", "idle", "f", "t", ["group:lecturers"], "ben"),
    ("Lecture hall 2", "paused", "f", "f", [], "dmitri"),
    ("Lecture hall 3", "offline", "f", None, [], None),
    ("Studio A", "capturing_audio_only", None, "t", ["group:studio", "user:juergen", "user:elif"], "juergen"),
    ("Studio B", "starting", "f", "t", ["group:studio", "user:nobody-any-more"], "nobody-any-more"),
    ("Library, reading room", "stopping", "f", "f", ["user:carla"], "carla"),
    ("Éditing suite", "uploading", None, "t", ["group:editors"], "carla"),
    ("Kiosk = foyer", "idle", "f", "f", [], "kiosk"),
    ("Roof", None, None, None, [], None),
    ("Old chapel", "offline", "t", "f", [], None),
    ("Workshop", "capturing", "t", "t", ["user:ben"], "ben"),
]

# directory name, disabled, access control, access list, last user, information file, strings by localization
WORKFLOWS = [
    ("Publish.workflow", None, "t", ["group:lecturers", "group:editors"], "anna",
     {"Name": "Publish", "Description": "Publishes a recording to the catalog", "Notes": "Version 2.4"},
     {"English": ("Publish to Catalog", "Encodes a recording and publishes it in the catalog."),
      "German": ("Im Katalog veröffentlichen", "Kodiert eine Aufnahme und veröffentlicht sie im Katalog."),
      "French": ("Publier au catalogue", "Encode un enregistrement et le publie au catalogue."),
      "ja": ("カタログに公開", "録画をエンコードしてカタログに公開します。")}),
    ("AudioEpisode.workflow", "f", "f", [], "ben",
     {"Name": "Audio Episode", "Description": "Makes an audio episode"},
     {"English": ("Audio Episode", "Takes the sound of a recording and makes an episode of it."),
      "German": ("Hörfolge", "Macht aus dem Ton einer Aufnahme eine Folge."),
      "fr": ("Épisode sonore", "Fait un épisode du son d'un enregistrement."),
      "ja": ("音声エピソード", "録画の音声からエピソードを作ります。")}),
    ("TwoCameras.workflow", "f", "t", ["user:juergen"], "juergen",
     {"Name": "Two Cameras", "Notes": "Needs two recordings of one event"},
     {"English": ("Picture in Picture", "Lays the second camera over the first one."),
      "de": ("Bild im Bild", "Legt die zweite Kamera über die erste.")}),
    ("Archive.workflow", None, None, [], None, {"Name": "Archive", "Description": "Copies to the archive"}, {}),
    ("Nameless.workflow", "f", "f", [], None, {}, {}),
    ("Removed.workflow", "f", "f", [], None, None, {}),
    ("Legacy.workflow", "t", "f", ["user:dmitri"], "dmitri", {"Name": "Legacy"}, {}),
]

# name, value, protected
PROPERTIES = [
    ("catalog_title", "Recordings of the Academy", False),
    ("catalog_password", "sesame", True),
    ("copyright", "© 2026 Academy of Examples", False),
    ("default_language", "de", False),
    ("intro_movie", "/Library/SorvaneProducer/Shared/Media/intro.mov", False),
    ("mail_sender", "recordings@media1.example.org", False),
    ("mail_password", "correct horse battery staple, and a good deal more than one line of text", True),
    ("episode_author", "Academy of Examples", False),
    ("upload_token", "0123456789abcdef0123456789abcdef", True),
    ("watermark", "", False),
]

DESCRIPTIONS = {
    "English": {
        "catalog_title": "Title shown above the catalog",
        "catalog_password": "Password with which recordings are published",
        "copyright": "Copyright line of every recording",
        "default_language": "Language of new recordings",
        "intro_movie": "Movie shown before each recording",
        "mail_sender": "Sender of the service's mail",
        "mail_password": "Password of the mail account",
        "episode_author": "Author of every episode",
    },
    "German": {
        "catalog_title": "Titel über dem Katalog",
        "catalog_password": "Kennwort, mit dem Aufnahmen veröffentlicht werden",
        "copyright": "Urheberrechtszeile jeder Aufnahme",
        "default_language": "Sprache neuer Aufnahmen",
        "intro_movie": "Film vor jeder Aufnahme",
    },
    "French": {
        "catalog_title": "Titre affiché au-dessus du catalogue",
        "catalog_password": "Mot de passe de publication",
        "copyright": "Mention \"copyright\" de chaque enregistrement",
        "mail_sender": "Expéditeur des messages du service",
    },
}

# The states of ten jobs, which repeat; a job that was never sent to the grid has neither id nor status.
JOB_STATUSES = ["Finished", "Finished", "Finished", "Running", "Finished", "Finished", "Pending", "Failed", None, "Canceled"]


def take(rows, count, more):
    """The first `count` rows; further ones come from more(n) with n from 1; None means the named ones."""
    if count is None:
        return rows
    return rows[:count] + [more(n) for n in range(1, count - len(rows) + 1)]


def cameras(count):
    statuses = ["idle", "offline", "capturing", "paused"]
    return take(CAMERAS, count, lambda n: (f"Camera {n:05d}", statuses[n % 4], "f", "t" if n % 2 else "f", [], None))


def workflows(count):
    return take(WORKFLOWS, count, lambda n: (
        f"Extra{n:05d}.workflow", "f", "f", [], None, {"Name": f"Extra {n}", "Description": f"Recipe number {n}"},
        {"English": (f"Extra Workflow {n}", f"Does step {n}."), "German": (f"Zusatz {n}", f"Macht Schritt {n}.")}))


def properties(count):
    return take(PROPERTIES, count, lambda n: (f"property_{n:05d}", f"value {n % 10}", n % 10 == 0))
