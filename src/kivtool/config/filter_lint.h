// The filters of a configuration, and names in them that no probe can have.
#pragma once

#include <google/protobuf/text_format.h>

#include <string>
#include <vector>

#include "config.pb.h"
#include "config/filters.h"
#include "kivtool/config/config_source.h"
#include "kivtool/config/lint_findings.h"

namespace kivd {

// One of the filters in a part kivd:FilterConfig.
struct written_filter {
    filter_kind kind;
    const char* things;  // it decides about
    kiv::config::Filter filter;
    lint_place place;
    const google::protobuf::TextFormat::ParseInfoTree* places;  // of its fields; null when unknown

    [[nodiscard]] lint_place place_of_item(int index) const;
};

// As far as the part can be decoded. `part` has to outlive them.
[[nodiscard]] std::vector<written_filter> filters_of(const part_content& part);

// Examines a package or a name. `nobody` says why an empty one, or one with a blank, is of no use.
void lint_text(const lint_place& place, const char* what, const std::string& text,
               const char* nobody, lint_findings& findings);

void lint_filter(const written_filter& filter, lint_findings& findings);

}  // namespace kivd
