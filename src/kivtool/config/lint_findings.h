// Findings about a configuration.
#pragma once

#include <google/protobuf/descriptor.h>
#include <google/protobuf/text_format.h>

#include <ostream>
#include <string>
#include <vector>

#include "kivtool/config/config_source.h"

namespace kivd {

struct lint_finding {
    bool is_error;
    std::string text;  // one line: place, error or warning, subject, what the daemon does
};

// A file, a line in it, counted from 1 (0: unknown), and what the finding is about.
struct lint_place {
    std::string path;
    int line = 0;
    std::string subject;
};

class lint_findings {
 public:
    void error(const lint_place& place, const std::string& text) { add(true, place, text); }
    void warning(const lint_place& place, const std::string& text) { add(false, place, text); }

    void append(lint_findings&& others);

    [[nodiscard]] bool has_errors() const;
    void print(std::ostream& out) const;

 private:
    void add(bool is_error, const lint_place& place, const std::string& text);

    std::vector<lint_finding> all_;
};

// "PACKAGE:NAME", printable.
[[nodiscard]] std::string id_of(const part_content& part);

// The line of a field, 0 when unknown. `index` is the position in a list, -1 for any other field.
[[nodiscard]] int line_of(const google::protobuf::TextFormat::ParseInfoTree* places,
                          const google::protobuf::FieldDescriptor& field, int index = -1);

}  // namespace kivd
