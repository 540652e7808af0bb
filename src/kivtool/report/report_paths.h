// The report files that a command line names.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace kivd {

// A file, or the reports of a directory in the order of their numbers. Paths are made on demand,
// since there may be very many.
class report_paths {
 public:
    // A directory that cannot be read, or that holds no reports, is a problem.
    explicit report_paths(const std::string& path);

    [[nodiscard]] size_t size() const { return is_directory_ ? numbers_.size() : 1; }
    [[nodiscard]] std::string path(size_t index) const;
    // As the end of a sentence about the path; empty when all is well.
    [[nodiscard]] const std::string& problem() const { return problem_; }

 private:
    std::string path_;  // with a final "/" when it is a directory
    bool is_directory_ = false;
    std::vector<int32_t> numbers_;
    std::string problem_;
};

}  // namespace kivd
