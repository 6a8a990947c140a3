"""The settings files, the key file, the database's location and the service's state files."""

import os
import plistlib

import names
import protect

SHARED = "/Library/SorvaneProducer/Shared"
STATE = "/var/lumio/server"
DATABASE = STATE + "/db/lumio.sqlite3"
MEMBER = names.uuid_of("member", "media1")
GRID_PASSWORD = "sample grid password"

IDENTITY = {"member_uuid": MEMBER, "shared_filesystem": SHARED}
LIBRARY = {"library_version": "2.4", "server_uuid": names.uuid_of("server", "library")}
MEMBER_PREFERENCES = {
    "server_host": "media1.example.org",
    "server_port": 8170,
    "sorvane_capture_web_enabled": True,
    "max_file_size_in_mb": 4096,
    "upload_chunk_size_in_mb": 8,
    "ssl_certificate_file": "/etc/ssl/certs/media1.pem",
    "ssl_certificate_key_file": "/etc/ssl/private/media1.key",
    "tunnel_agent_host": "localhost",
    "tunnel_agent_port": 8172,
    "tunnel_server_host": "tunnel.example.org",
    "tunnel_server_port": 443,
    "tunnel_timeout_seconds": 30,
    "local_note": "kept by the service, not administered here",
}
CLUSTER_PREFERENCES = {
    "agent_max_recording_minutes": 240,
    "agent_unattended_recording_minutes": 15,
    "http_auth_type": "basic",
    "camera_status_min_interval_seconds": 5,
    "camera_watcher_check_interval_seconds": 20,
    "camera_preview_cache_seconds": 2,
    "agent_timeout_seconds": 60,
    "nimbo_controller": "grid1.example.org",
    "nimbo_job_cleanup_minutes": 1440,
    "submissions_groupname": "lecturers",
    "external_command_timeout_seconds": 120,
    "nimbo_client_username": "lumiogrid",
    "nimbo_grid_id": "0",
}

LOGS = {
    "startup.log": "2026-01-31 07:58:02 lumioserverd 2.4 starting\n2026-01-31 07:58:04 ready on port 8170\n",
    "application.log": "2026-01-31 08:00:00 INFO camera \"Main hall\" capturing\n",
    "lumioserverd_out.log": "web application up\n",
    "lumioserverd_error.log": "",
    "apache_access.log": '192.0.2.17 - anna [31/Jan/2026:08:00:11 +0000] "GET /sorvaneproducer/capture HTTP/1.1" 200 5120\n',
    "apache_error.log": "",
}

DATABASE_YML = f"""# Where the service keeps its data.
development:
  adapter: sqlite3
  database: db/development.sqlite3

production:
  adapter: sqlite3
  database: {DATABASE}
  timeout: 5000
"""


def below(root, path):
    """The disk path of a host path; creates its directory."""
    disk = root / path.lstrip("/")
    disk.parent.mkdir(parents=True, exist_ok=True)
    return disk


def write_plist(root, path, value, form=plistlib.FMT_XML):
    with open(below(root, path), "wb") as out:
        plistlib.dump(value, out, fmt=form, sort_keys=False)


def write(root):
    cluster = dict(CLUSTER_PREFERENCES, nimbo_client_password=protect.protected(GRID_PASSWORD))
    write_plist(root, "/Library/Preferences/com.brenn.lumioserverd.plist", IDENTITY)
    write_plist(root, SHARED + "/lumioserverd.plist", LIBRARY)
    write_plist(root, f"{SHARED}/Server/member_preferences_{MEMBER}.plist", MEMBER_PREFERENCES)
    write_plist(root, SHARED + "/Server/cluster_preferences.plist", cluster)
    write_plist(root, SHARED + "/Server/Secrets/kek.plist", {"lumio_secret": protect.secret()})
    os.chmod(below(root, SHARED + "/Server/Secrets/kek.plist"), 0o600)
    write_plist(root, STATE + "/.lumioserverd_startup_status.plist", {"error": 0})
    below(root, STATE + "/.lumio_setup_done").touch()
    below(root, STATE + "/database.yml").write_text(DATABASE_YML, encoding="utf-8")
    for name, text in LOGS.items():
        below(root, "/Library/Logs/lumioserverd/" + name).write_text(text, encoding="utf-8")
    write_plist(root, "/System/Library/LaunchDaemons/com.brenn.lumioserverd.plist",
                {"Label": "com.brenn.lumioserverd", "ProgramArguments": ["/usr/sbin/lumioserverd"], "KeepAlive": True})
    for directory in ("var/run", "var/log", "etc/demo", "tmp"):
        (root / directory).mkdir(parents=True, exist_ok=True)
