#pragma once

// The properties that a write is about to remove, as they are before it. A removal itself reads nothing, so that its
// report could only have the row's number, and the history could neither name nor restore the property.

#include "platform/value/Value.h"

#include <map>
#include <string>

namespace lumio {

class FormerProperties {
  public:
    struct Row {
        std::string name;
        std::string value;  ///< empty if it is protected
        bool isProtected = false;
    };

    /// Reads the rows that these changes remove with one statement; runs none if they remove nothing. Rows that cannot
    /// be read stay unknown: the write is carried out all the same.
    explicit FormerProperties(const adminhost::Array* changes);
    ~FormerProperties();
    FormerProperties(const FormerProperties&) = delete;
    FormerProperties& operator=(const FormerProperties&) = delete;

    /// The row with this number, from the object that exists now; null if it is not known.
    [[nodiscard]] static const Row* find(const std::string& id) noexcept;

  private:
    std::map<std::string, Row> _rows;
    static FormerProperties* _current;
};

}  // namespace lumio
