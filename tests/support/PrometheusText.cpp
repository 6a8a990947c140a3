#include "tests/support/PrometheusText.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <set>
#include <stdexcept>
#include <vector>

namespace adminhost::test {
namespace {

[[noreturn]] void fail(std::string_view problem, std::string_view line) {
    throw std::runtime_error(std::string(problem) + ": " + std::string(line));
}

bool isNameCharacter(char c, bool first, bool colon) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '_' || (colon && c == ':') ||
           (!first && c >= '0' && c <= '9');
}

std::string takeName(std::string_view& rest, bool colon, std::string_view line) {
    std::size_t size = 0;
    while (size < rest.size() && isNameCharacter(rest[size], size == 0, colon)) {
        ++size;
    }
    if (size == 0) {
        fail("a name is missing", line);
    }
    std::string name(rest.substr(0, size));
    rest.remove_prefix(size);
    return name;
}

void take(std::string_view& rest, char wanted, std::string_view line) {
    if (rest.empty() || rest.front() != wanted) {
        fail(std::string("\"") + wanted + "\" is missing", line);
    }
    rest.remove_prefix(1);
}

std::string takeQuoted(std::string_view& rest, std::string_view line) {
    take(rest, '"', line);
    std::string text;
    while (!rest.empty() && rest.front() != '"') {
        char c = rest.front();
        rest.remove_prefix(1);
        if (c == '\\') {
            const char escaped = rest.empty() ? '\0' : rest.front();
            if (escaped != '\\' && escaped != '"' && escaped != 'n') {
                fail("an unknown escape", line);
            }
            c = escaped == 'n' ? '\n' : escaped;
            rest.remove_prefix(1);
        }
        text += c;
    }
    take(rest, '"', line);
    return text;
}

double numberIn(std::string_view text, std::string_view line) {
    if (text == "+Inf") {
        return std::numeric_limits<double>::infinity();
    }
    const std::string copy(text);
    char* end = nullptr;
    const double number = std::strtod(copy.c_str(), &end);
    if (copy.empty() || end != copy.c_str() + copy.size() || !std::isfinite(number)) {
        fail("not a number", line);
    }
    return number;
}

class Reader {
  public:
    void line(std::string_view line) {
        if (line.starts_with("# ")) {
            comment(line);
            return;
        }
        std::string_view rest = line;
        const std::string name = takeName(rest, true, line);
        PrometheusText::Labels labels;
        if (rest.starts_with('{')) {
            rest.remove_prefix(1);
            while (!rest.starts_with('}')) {
                const std::string label = takeName(rest, false, line);
                take(rest, '=', line);
                if (!labels.emplace(label, takeQuoted(rest, line)).second) {
                    fail("a label that occurs twice", line);
                }
                if (!rest.starts_with('}')) {
                    take(rest, ',', line);
                }
            }
            rest.remove_prefix(1);
        }
        take(rest, ' ', line);
        const double value = numberIn(rest, line);
        const std::string family = familyOf(name);
        if (family != _current) {
            fail("a sample that does not follow the TYPE of its name", line);
        }
        if (text.types[family] == "counter" && value < 0) {
            fail("a counter below 0", line);
        }
        if (!text.samples[name].emplace(labels, value).second) {
            fail("a sample that occurs twice", line);
        }
        if (name.ends_with("_bucket") && text.types[family] == "histogram") {
            bucket(labels, value, line);
        }
    }

    void end() const {
        for (const auto& [family, type] : text.types) {
            if (type != "histogram" || !text.samples.contains(family + "_count")) {
                continue;
            }
            for (const auto& [labels, count] : text.samples.at(family + "_count")) {
                PrometheusText::Labels last = labels;
                last["le"] = "+Inf";
                if (text.at(family + "_bucket", last) != count || !text.samples.at(family + "_sum").contains(labels)) {
                    fail("a histogram that is not complete", family);
                }
            }
        }
    }

    PrometheusText text;

  private:
    void comment(std::string_view line) {
        std::string_view rest = line.substr(2);
        const bool help = rest.starts_with("HELP ");
        if (!help && !rest.starts_with("TYPE ")) {
            fail("an unknown comment", line);
        }
        rest.remove_prefix(5);
        const std::string name = takeName(rest, true, line);
        take(rest, ' ', line);
        if (help) {
            if (!_helped.insert(name).second || rest.empty()) {
                fail("a second HELP, or an empty one", line);
            }
            return;
        }
        if (rest != "counter" && rest != "gauge" && rest != "histogram") {
            fail("an unknown type", line);
        }
        if (!text.types.emplace(name, rest).second || !_helped.contains(name)) {
            fail("a second TYPE, or one without HELP", line);
        }
        _current = name;
    }

    [[nodiscard]] std::string familyOf(const std::string& name) const {
        for (const std::string_view suffix : {"_bucket", "_sum", "_count"}) {
            const std::string family = name.substr(0, name.size() - std::min(suffix.size(), name.size()));
            const auto type = text.types.find(family);
            if (name.ends_with(suffix) && type != text.types.end() && type->second == "histogram") {
                return family;
            }
        }
        return name;
    }

    void bucket(PrometheusText::Labels labels, double value, std::string_view line) {
        const auto le = labels.find("le");
        if (le == labels.end()) {
            fail("a bucket without its bound", line);
        }
        const double bound = numberIn(le->second, line);
        labels.erase(le);
        const bool same = labels == _bucketLabels && !_newHistogram;
        if (same && (bound <= _bound || value < _value)) {
            fail("buckets that do not increase", line);
        }
        _bucketLabels = labels;
        _newHistogram = std::isinf(bound);
        _bound = bound;
        _value = value;
    }

    std::set<std::string> _helped;
    std::string _current;
    PrometheusText::Labels _bucketLabels;
    bool _newHistogram = true;
    double _bound = 0;
    double _value = 0;
};

}  // namespace

double PrometheusText::at(const std::string& name, const Labels& labels) const {
    const auto found = samples.find(name);
    if (found == samples.end() || !found->second.contains(labels)) {
        throw std::runtime_error("no such sample: " + name);
    }
    return found->second.at(labels);
}

double PrometheusText::sum(const std::string& name, const Labels& labels) const {
    double all = 0;
    const auto found = samples.find(name);
    if (found != samples.end()) {
        for (const auto& [own, value] : found->second) {
            const bool fits = std::all_of(labels.begin(), labels.end(), [&own = own](const auto& label) {
                const auto it = own.find(label.first);
                return it != own.end() && it->second == label.second;
            });
            all += fits ? value : 0;
        }
    }
    return all;
}

PrometheusText parsePrometheusText(std::string_view text) {
    if (!text.ends_with('\n')) {
        throw std::runtime_error("the last line has no end");
    }
    Reader reader;
    while (!text.empty()) {
        const std::size_t end = text.find('\n');
        reader.line(text.substr(0, end));
        text.remove_prefix(end + 1);
    }
    reader.end();
    return reader.text;
}

}  // namespace adminhost::test
