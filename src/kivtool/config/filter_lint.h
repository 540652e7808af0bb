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
    const char* things;  // that it is about
    kiv::config::Filter filter;
    lint_place place;
    const google::protobuf::TextFormat::ParseInfoTree* places;  // of its items; null when unknown

    [[nodiscard]] lint_place place_of_item(int index) const;
};

// As far as the part can be decoded. They hold on to its places.
[[nodiscard]] std::vector<written_filter> filters_of(const part_content& part);

// Looks over a package or a name: `nobody` says what does not happen when it is empty or has a
// blank.
void lint_text(const lint_place& place, const char* what, const std::string& text,
               const char* nobody, lint_findings& findings);

void lint_filter(const written_filter& filter, lint_findings& findings);

}  // namespace kivd
