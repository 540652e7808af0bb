// Configuration files as those who prepare them make them, signed by somebody else's tool.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "config.pb.h"

namespace kivd {

struct config_part {
    std::string package;
    std::string name;
    std::string payload;
};

// One of the daemon's own parts, from its text form: own_part<kivd::Settings>("Settings", "...").
template <class message>
config_part own_part(const std::string& name, const std::string& text);

// A packed kiv.config.ConfigPackage.
std::string pack(const std::vector<config_part>& parts);
// One gzip member; of level 0 its bytes are stored.
std::string gzip(std::string_view bytes, int level = 9);
// The file, without a signature when there is none.
std::string config_file(const std::string& compressed_data, const std::string& signature = "");
inline std::string config_file(const std::vector<config_part>& parts) {
    return config_file(gzip(pack(parts)));
}

// Runs `openssl` with these arguments in the current directory; gives what it prints.
std::string openssl(const std::string& arguments);
// Makes a key pair: NAME.key, and its public half as kiv_NAME.pem.
void make_keys(const std::string& name, int bits = 1024);
// The signature over `data` with NAME.key.
std::string sign(const std::string& data, const std::string& name);

}  // namespace kivd
