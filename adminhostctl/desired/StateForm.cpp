#include "adminhostctl/desired/StateForm.h"

#include "adminhostctl/Failure.h"

#include <algorithm>

namespace adminhost::ctl {
namespace {

/// The last key of a path directly below another one ("a.b" below "a", "a[].b" below "a[]"); empty for other paths.
std::string keyBelow(const std::string& path, const std::string& above) {
    const std::string prefix = above + '.';
    if (!path.starts_with(prefix) || path.find_first_of(".[", prefix.size()) != std::string::npos) {
        return {};
    }
    return path.substr(prefix.size());
}

template <typename Range, typename Fits>
auto findIn(const Range& range, const Fits& fits) noexcept {
    const auto found = std::find_if(range.begin(), range.end(), fits);
    return found == range.end() ? nullptr : &*found;
}

}  // namespace

const FieldForm* ListForm::fieldOf(std::string_view wanted) const noexcept {
    return findIn(fields, [&](const FieldForm& field) { return field.key == wanted; });
}

const FieldForm* ListForm::fieldInFile(std::string_view name) const noexcept {
    return findIn(fields, [&](const FieldForm& field) { return field.inFile == name; });
}

bool ListForm::isPeople(std::string_view name) const noexcept {
    return std::any_of(people.begin(), people.end(), [&](const PeopleForm& form) {
        return std::any_of(form.kinds.begin(), form.kinds.end(), [&](const auto& kind) { return kind.second == name; });
    });
}

StateForm::StateForm(const Description& write) : _command(write.name()) {
    for (const DescribedKey& key : write.keys()) {
        if (!key.section.empty() && key.type == "dictionary" && !key.path.ends_with("[]")) {
            _root = key.path;
            _settingsSection = key.section;
        }
    }
    if (_root.empty()) {
        throw Failure(ExitStatus::failed, _command + " does not describe which of its keys are settings");
    }
    for (const DescribedKey& key : write.keys()) {
        if (!key.file.empty() && !keyBelow(key.path, _root).empty()) {
            (key.secret ? _secrets : _settings).push_back(key);
        } else if (!key.section.empty() && key.path.ends_with("[]")) {
            addList(write, key);
        }
    }
    std::stable_partition(_lists.begin(), _lists.end(), [](const ListForm& list) { return !list.addedBy.empty(); });
}

void StateForm::addList(const Description& write, const DescribedKey& element) {
    ListForm list;
    list.section = element.section;
    list.key = keyBelow(element.path.substr(0, element.path.size() - 2), _root);
    list.identity = element.identity;
    list.label = element.label;
    list.byIdentity = element.byIdentity;
    list.localized = element.localized;
    list.otherNames = element.otherNames;
    list.addedBy = element.addedBy;
    list.removedBy = element.removedBy;
    list.unlisted = element.unlisted;
    for (const DescribedKey& key : write.keys()) {
        const std::string name = keyBelow(key.path, element.path);
        if (!name.empty() && !key.inFile.empty()) {
            list.fields.push_back({name, key.inFile, key.type == "boolean", key.secretIf});
        }
        const DescribedKey* person = name.empty() ? nullptr : write.key(key.path + "[]");
        if (person != nullptr && !person->kinds.empty()) {
            list.people.push_back({name, person->identity, person->label, person->kind, person->addedBy,
                                   person->removedBy, person->unlisted, person->kinds});
        }
    }
    _lists.push_back(std::move(list));
}

const DescribedKey* StateForm::setting(std::string_view name) const noexcept {
    return findIn(_settings, [&](const DescribedKey& key) { return nameOf(key) == name; });
}

const DescribedKey* StateForm::secret(std::string_view name) const noexcept {
    return findIn(_secrets, [&](const DescribedKey& key) { return nameOf(key) == name; });
}

const ListForm& StateForm::list(std::string_view section) const {
    const ListForm* found = findIn(_lists, [&](const ListForm& list) { return list.section == section; });
    if (found == nullptr) {
        throw Failure(ExitStatus::failed, _command + " does not describe a section " + std::string(section));
    }
    return *found;
}

std::vector<std::string> StateForm::switches() const {
    std::vector<std::string> all;
    const auto add = [&](const std::string& name) {
        // Several lists may share a switch.
        if (!name.empty() && std::find(all.begin(), all.end(), name) == all.end()) {
            all.push_back(name);
        }
    };
    for (const ListForm& list : _lists) {
        add(list.unlisted);
        for (const PeopleForm& people : list.people) {
            add(people.unlisted);
        }
    }
    return all;
}

std::string StateForm::nameOf(const DescribedKey& setting) const {
    return setting.path.substr(_root.size() + 1);
}

}  // namespace adminhost::ctl
