#include "support/config_package.h"

#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>
#include <zlib.h>

#include "settings.pb.h"
#include "support/outside_tools.h"
#include "support/scratch_directory.h"

namespace kivd {

template <class message>
config_part own_part(const std::string& name, const std::string& text) {
    message parsed;
    EXPECT_TRUE(google::protobuf::TextFormat::ParseFromString(text, &parsed)) << text;
    return {"kivd", name, parsed.SerializeAsString()};
}
template config_part own_part<kiv::config::FilterConfig>(const std::string&, const std::string&);
template config_part own_part<Settings>(const std::string&, const std::string&);
template config_part own_part<RunActions>(const std::string&, const std::string&);
template config_part own_part<RunActionsOnce>(const std::string&, const std::string&);

std::string pack(const std::vector<config_part>& parts) {
    kiv::config::ConfigPackage package;
    for (const config_part& part : parts) {
        auto& added = *package.add_parts();
        added.set_package(part.package);
        added.set_name(part.name);
        added.set_payload(part.payload);
    }
    return package.SerializeAsString();
}

std::string gzip(std::string_view bytes, int level) {
    z_stream stream = {};
    EXPECT_EQ(deflateInit2(&stream, level, Z_DEFLATED, 16 + MAX_WBITS, 8, Z_DEFAULT_STRATEGY),
              Z_OK);
    std::string compressed(deflateBound(&stream, bytes.size()) + 32, '\0');
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));
    stream.avail_in = static_cast<uInt>(bytes.size());
    stream.next_out = reinterpret_cast<Bytef*>(compressed.data());
    stream.avail_out = static_cast<uInt>(compressed.size());
    EXPECT_EQ(deflate(&stream, Z_FINISH), Z_STREAM_END);
    compressed.resize(stream.total_out);
    deflateEnd(&stream);
    return compressed;
}

std::string config_file(const std::string& compressed_data, const std::string& signature) {
    kiv::config::ConfigResponse file;
    if (!signature.empty()) file.set_signature(signature);
    file.set_compressed_data(compressed_data);
    return file.SerializeAsString();
}

std::string openssl(const std::string& arguments) {
    const outcome ended = run("openssl " + arguments + " 2>openssl.err");
    EXPECT_EQ(ended.status, 0) << arguments << read_file("openssl.err");
    return ended.output;
}

void make_keys(const std::string& name, int bits) {
    openssl("genrsa -out " + name + ".key " + std::to_string(bits));
    openssl("pkey -in " + name + ".key -pubout -out kiv_" + name + ".pem");
}

std::string sign(const std::string& data, const std::string& name) {
    write_file("signed", data);
    return openssl("dgst -sha1 -sign " + name + ".key signed");
}

}  // namespace kivd
