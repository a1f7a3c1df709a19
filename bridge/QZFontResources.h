// The fontconfig patterns that clients send on the session bus (`:lang=ja`, `:lang=zh-cn`,
// `:lang=und-zsye`, `:family=Noto Sans`), turned into the languages and families to offer fonts
// for.
#pragma once

#include <string>
#include <string_view>
#include <vector>

/// What a set of resources asks for: languages (fontconfig tags) and family names, each once,
/// in arrival order, at most kMaximumWanted of each.
struct QZFontResourceWants {
    static constexpr size_t kMaximumWanted = 64;
    std::vector<std::string> languages;
    std::vector<std::string> families;

    bool Empty() const { return languages.empty() && families.empty(); }
    /// Adds what `other` asks for that this does not yet hold, within the limits.
    void Merge(const QZFontResourceWants& other);
};

/// Patterns longer than this are not read.
constexpr size_t kMaximumResourceSize = 512;

/// Adds what the fontconfig pattern `resource` asks for to `wants`: each tag of its `lang`
/// property, each name of its `family` property or of the family list before its first ":". Other
/// properties are ignored. False, with `wants` unchanged, when it asks for nothing that can be
/// served (no language or family, a malformed tag, a pattern over kMaximumResourceSize bytes, or
/// text that is not UTF-8).
bool QZAddFontResource(std::string_view resource, QZFontResourceWants& wants);
