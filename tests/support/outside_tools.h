// Programs run as a user would run them, those of others to judge our output among them.
#pragma once

#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdio>
#include <string>

namespace kivd {

struct outcome {
    int status;
    std::string output;  // standard output and error
};

// Runs a line of shell.
inline outcome run(const std::string& command) {
    FILE* pipe = popen(("( " + command + " ) 2>&1").c_str(), "re");
    if (pipe == nullptr) abort();
    std::string output;
    char piece[4096];
    while (const size_t size = fread(piece, 1, sizeof piece, pipe)) output.append(piece, size);
    const int status = pclose(pipe);
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, output};
}

// Makes NAME.pem and NAME.pub.pem in `directory`.
inline void make_key(const std::string& directory, const std::string& name,
                     const std::string& kind = "RSA -pkeyopt rsa_keygen_bits:2048") {
    const outcome made =
        run("cd " + directory + " && openssl genpkey -algorithm " + kind + " -out " + name +
            ".pem && openssl pkey -in " + name + ".pem -pubout -out " + name + ".pub.pem");
    EXPECT_EQ(made.status, 0) << made.output;
}

}  // namespace kivd
