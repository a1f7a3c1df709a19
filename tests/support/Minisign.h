// Test helper: a key pair made with the real `minisign` tool, and signatures made with it.
#pragma once

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>

namespace glyphwell::testing {

class MinisignKey {
public:
    /// Makes a key pair without a password in `directory` (files NAME.pub and NAME.key).
    MinisignKey(const std::string& directory, const std::string& name)
        : publicPath_(directory + "/" + name + ".pub"),
          secretPath_(directory + "/" + name + ".key") {
        const std::string command =
            "minisign -G -W -f -p '" + publicPath_ + "' -s '" + secretPath_ + "' >/dev/null 2>&1";
        if (std::system(command.c_str()) != 0)
            return;
        std::ifstream file(publicPath_);
        std::string line;
        std::getline(file, line); // untrusted comment
        std::getline(file, publicKey_);
    }

    /// Whether the tool made the key (false when minisign is not installed).
    bool IsValid() const { return !publicKey_.empty(); }
    /// The base64 line of the public key.
    const std::string& PublicKey() const { return publicKey_; }

    /// Signs the file `path` into `path`.minisig with `trustedComment` (prehashed unless
    /// `legacy`); true when the tool succeeded.
    bool Sign(const std::string& path, const std::string& trustedComment,
              bool legacy = false) const {
        const std::string command = std::string("minisign -S") + (legacy ? " -l" : "") + " -s '" +
                                    secretPath_ + "' -m '" + path + "' -t '" + trustedComment +
                                    "' >/dev/null 2>&1";
        return std::system(command.c_str()) == 0;
    }

private:
    std::string publicPath_;
    std::string secretPath_;
    std::string publicKey_;
};

} // namespace glyphwell::testing
