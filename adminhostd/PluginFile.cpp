#include "adminhostd/PluginFile.h"

#include "adminhostd/PluginCall.h"
#include "platform/files/FileDescriptor.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <bit>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <iterator>
#include <set>
#include <utility>

#include <dlfcn.h>
#include <elf.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr std::size_t notesMaximum = std::size_t{64} << 10U;
constexpr std::size_t segmentsMaximum = 256;
constexpr int depthMaximum = 32;          ///< of a description
constexpr std::size_t wordMaximum = 100;  ///< bytes of a plug-in's or a command's name

const uid_t startAccount = ::geteuid();  ///< of the daemon: the front changes its own later

bool readAt(int file, std::uint64_t offset, void* place, std::size_t size) {
    return ::pread(file, place, size, static_cast<off_t>(offset)) == static_cast<ssize_t>(size);
}

std::size_t padded(std::size_t size) {
    return (size + 3) & ~std::size_t{3};
}

/// The description of our note in the bytes of one note segment.
std::optional<std::string> identityIn(std::string_view notes) {
    while (notes.size() >= sizeof(Elf64_Nhdr)) {
        Elf64_Nhdr header{};
        std::memcpy(&header, notes.data(), sizeof header);
        notes.remove_prefix(sizeof header);
        if (notes.size() < padded(header.n_namesz)) {
            return std::nullopt;
        }
        const std::string_view name = notes.substr(0, header.n_namesz);
        notes.remove_prefix(padded(header.n_namesz));
        const std::string_view description = notes.substr(0, header.n_descsz);
        if (header.n_type == buildNoteType && name.substr(0, name.find('\0')) == buildNoteName) {
            return std::string(description.substr(0, description.find('\0')));
        }
        notes.remove_prefix(std::min(notes.size(), padded(header.n_descsz)));
    }
    return std::nullopt;
}

bool isAddressWord(std::string_view word) {
    return !word.empty() && word.size() <= wordMaximum && std::all_of(word.begin(), word.end(), [](char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' || c == '_';
    });
}

/// The first name that the front cannot serve: not a word, used twice, or "history", an address of the front's own.
std::optional<std::string> unusableName(const std::vector<Command>& commands) {
    std::set<std::string_view> names;
    for (const Command& command : commands) {
        if (!isAddressWord(command.name) || command.name == "history" || !names.insert(command.name).second) {
            return command.name;
        }
    }
    return std::nullopt;
}

/// Returns true if it can be sent to clients: every text is UTF-8, and its nesting is bounded.
bool isPresentable(const Value& value, int depth) {
    if (depth > depthMaximum) {
        return false;
    }
    if (const std::string* text = value.string()) {
        return isUtf8(*text);
    }
    if (const Array* array = value.array()) {
        return std::all_of(array->begin(), array->end(), [&](const Value& v) { return isPresentable(v, depth + 1); });
    }
    if (const Dictionary* dictionary = value.dictionary()) {
        return std::all_of(dictionary->begin(), dictionary->end(), [&](const DictionaryEntry& entry) {
            return isUtf8(entry.key) && isPresentable(entry.value, depth + 1);
        });
    }
    return true;
}

tl::unexpected<Error> refused(std::string reason) {
    return failure({"plugin", 0, std::move(reason)});
}

}  // namespace

std::optional<std::string> distrust(const DiskPath& path) {
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
        return fmt::format("{}: {}; create it or choose another place", path.text(), std::strerror(errno));
    }
    if (status.st_uid != 0 && status.st_uid != startAccount) {
        return fmt::format("{} belongs to uid {}; chown it to root", path.text(), status.st_uid);
    }
    if ((status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
        return fmt::format("{} may be written by group or others; chmod go-w it", path.text());
    }
    return std::nullopt;
}

std::optional<std::string> distrustNamed(const DiskPath& path) {
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
        return std::nullopt;
    }
    if (startAccount == 0 && systemRoot() == "/") {
        return distrust(path);
    }
    if ((status.st_mode & S_IWOTH) == 0) {
        return std::nullopt;
    }
    return fmt::format("{} may be written by everybody; chmod o-w it", path.text());
}

std::optional<std::vector<DiskPath>> pluginsIn(const DiskPath& directory) {
    std::error_code failure;
    std::vector<DiskPath> files;
    for (std::filesystem::directory_iterator at(directory.text(), failure), end; !failure && at != end;
         at.increment(failure)) {
        if (at->path().extension() == ".so") {
            files.emplace_back(at->path().string());
        }
    }
    if (failure) {
        errno = failure.value();
        return std::nullopt;
    }
    std::ranges::sort(files, {}, &DiskPath::text);
    return files;
}

Result<std::string> buildIdentityOf(const DiskPath& path) {
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    if (!file.isOpen()) {
        return refused(fmt::format("{}: {}; install it or correct its name", path.text(), std::strerror(errno)));
    }
    constexpr int ownOrder = std::endian::native == std::endian::little ? ELFDATA2LSB : ELFDATA2MSB;
    Elf64_Ehdr header{};
    if (!readAt(file.get(), 0, &header, sizeof header) || std::memcmp(header.e_ident, ELFMAG, SELFMAG) != 0 ||
        header.e_ident[EI_CLASS] != ELFCLASS64 || header.e_ident[EI_DATA] != ownOrder || header.e_type != ET_DYN ||
        header.e_phentsize != sizeof(Elf64_Phdr)) {
        return refused(fmt::format("{} is not a shared object for this kind of machine", path.text()));
    }
    struct stat status {};
    const std::uint64_t length = ::fstat(file.get(), &status) == 0 ? static_cast<std::uint64_t>(status.st_size) : 0;
    std::optional<std::string> identity;
    for (std::size_t i = 0; i < std::min<std::size_t>(header.e_phnum, segmentsMaximum); ++i) {
        Elf64_Phdr segment{};
        if (!readAt(file.get(), header.e_phoff + i * sizeof segment, &segment, sizeof segment)) {
            break;
        }
        if (segment.p_type == PT_LOAD && (segment.p_offset > length || segment.p_filesz > length - segment.p_offset)) {
            // Running it would end in SIGBUS, but perhaps only in the middle of an operation.
            return refused(fmt::format("{} is truncated; install it again", path.text()));
        }
        if (identity || segment.p_type != PT_NOTE || segment.p_filesz > notesMaximum) {
            continue;
        }
        std::string notes(segment.p_filesz, '\0');
        if (readAt(file.get(), segment.p_offset, notes.data(), notes.size())) {
            identity = identityIn(notes);
        }
    }
    if (!identity) {
        return refused(fmt::format("{} has no build note: it is not a plug-in for this daemon", path.text()));
    }
    return *identity;
}

Result<LoadedPlugin> loadPlugin(const DiskPath& file) {
    const auto identity = buildIdentityOf(file);
    if (!identity) {
        return failure(identity.error());
    }
    if (*identity != ADMINHOST_BUILD_IDENTITY) {
        return refused(fmt::format(
            "{} is for \"{}\", and this daemon loads plug-ins for \"{}\"; install the plug-in's release that "
            "is made for this daemon",
            file.text(), *identity, ADMINHOST_BUILD_IDENTITY));
    }
    // A name without a slash would be searched for in the library path.
    const std::string name = file.text().find('/') == std::string::npos ? "./" + file.text() : file.text();
    void* library = ::dlopen(name.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (library == nullptr) {
        return refused(fmt::format("{} cannot be loaded: {}", file.text(), ::dlerror()));
    }
    using EntryPoint = Plugin* (*)();
    const auto entry = reinterpret_cast<EntryPoint>(::dlsym(library, "adminhost_plugin"));
    if (entry == nullptr) {
        return refused(fmt::format("{} has no entry point adminhost_plugin", file.text()));
    }
    auto loaded = callPlugin([&] {
        LoadedPlugin described;
        described.plugin = entry();
        if (described.plugin != nullptr) {
            described.name = described.plugin->name();
            described.version = described.plugin->version();
            described.commands = described.plugin->commands();
        }
        return described;
    });
    if (!loaded) {
        return refused(fmt::format("{} failed while it was loaded: {}", file.text(), *loaded.error().description));
    }
    if (loaded->plugin == nullptr) {
        return refused(fmt::format("{} has an entry point that returns no plug-in", file.text()));
    }
    constexpr std::string_view ownAddresses[] = {"requests", "directory", "doctor", "logs",
                                                 "events",   "metrics",   "audit"};
    if (!isAddressWord(loaded->name) ||
        std::find(std::begin(ownAddresses), std::end(ownAddresses), loaded->name) != std::end(ownAddresses)) {
        return refused(
            fmt::format("{} has the name \"{}\", which cannot be part of an address", file.text(), loaded->name));
    }
    if (const auto command = unusableName(loaded->commands)) {
        return refused(
            fmt::format("{} describes a command \"{}\", which cannot be part of an address or is described twice",
                        file.text(), *command));
    }
    for (const Command& command : loaded->commands) {
        const bool named = std::all_of(command.needs.begin(), command.needs.end(), isAddressWord);
        if (!named || command.deadline.count() < 0 || !isPresentable(command.description, 0)) {
            return refused(fmt::format("{} describes its command \"{}\" in a form that clients cannot be sent",
                                       file.text(), command.name));
        }
    }
    if (!isUtf8(loaded->version)) {
        return refused(fmt::format("{} has a version that is not text", file.text()));
    }
    return loaded;
}

}  // namespace adminhost
