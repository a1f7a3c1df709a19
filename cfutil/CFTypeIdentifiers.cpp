#include "cfutil/CFTypeIdentifiers.h"

#include <fnmatch.h>

#include <fstream>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "cfutil/CFStringUtilities.h"
#include "cfutil/CFUserDirectories.h"

namespace {

/// Lines longer than this are not MIME database lines; they are skipped.
constexpr size_t kMaxLineLength = 4096;

std::string LowerASCII(std::string_view text) {
    std::string lower(text);
    for (char& c : lower)
        if (c >= 'A' && c <= 'Z')
            c = char(c - 'A' + 'a');
    return lower;
}

/// Calls `line` for every line (without its newline) of the database file `name` in each data
/// directory, most important directory first, with that directory's index.
template <class LineFunction> void ForEachDatabaseLine(const char* name, LineFunction line) {
    std::vector<std::string> directories = GetDataDirectories();
    for (size_t index = 0; index < directories.size(); ++index) {
        std::ifstream file(directories[index] + "/mime/" + name);
        std::string text;
        while (std::getline(file, text))
            if (text.size() <= kMaxLineLength && !text.empty() && text[0] != '#')
                line(index, std::string_view(text));
    }
}

struct Glob {
    int weight;
    std::string type;
    std::string pattern;
    bool caseSensitive;
};

bool HasWildcard(std::string_view pattern) {
    return pattern.find_first_of("*?[") != std::string_view::npos;
}

/// The glob lines "weight:type:pattern[:flags[:...]]" of every directory, less important
/// directories contributing only types that no more important directory lists.
std::vector<Glob> ReadGlobs() {
    std::vector<Glob> globs;
    std::map<std::string, size_t> typeDirectory; // type -> the directory that defines it
    ForEachDatabaseLine("globs2", [&](size_t directory, std::string_view line) {
        std::vector<std::string_view> fields;
        while (fields.size() < 4) {
            size_t colon = line.find(':');
            fields.push_back(line.substr(0, colon));
            if (colon == std::string_view::npos)
                break;
            line.remove_prefix(colon + 1);
        }
        if (fields.size() < 3 || fields[0].empty() || fields[1].empty() || fields[2].empty() ||
            fields[0].size() > 3 || fields[0].find_first_not_of("0123456789") != std::string::npos)
            return;
        std::string type = LowerASCII(fields[1]);
        auto [entry, inserted] = typeDirectory.try_emplace(type, directory);
        if (!inserted && entry->second != directory)
            return; // a more important directory has its own patterns for this type
        if (fields[2] == "__NOGLOBS__")
            return;
        bool caseSensitive = false;
        if (fields.size() == 4) {
            std::string_view flags = fields[3];
            while (!flags.empty()) {
                size_t comma = flags.find(',');
                caseSensitive |= flags.substr(0, comma) == "cs";
                flags =
                    comma == std::string_view::npos ? std::string_view() : flags.substr(comma + 1);
            }
        }
        globs.push_back({std::stoi(std::string(fields[0])), std::move(type), std::string(fields[2]),
                         caseSensitive});
    });
    return globs;
}

bool Matches(const Glob& glob, const std::string& name, const std::string& lowerName) {
    if (!HasWildcard(glob.pattern))
        return glob.pattern == name ||
               (!glob.caseSensitive && LowerASCII(glob.pattern) == lowerName);
    if (fnmatch(glob.pattern.c_str(), name.c_str(), 0) == 0)
        return true;
    return !glob.caseSensitive &&
           fnmatch(LowerASCII(glob.pattern).c_str(), lowerName.c_str(), 0) == 0;
}

/// The parents of each type from every "subclasses" file ("child parent" per line).
std::multimap<std::string, std::string> ReadParents() {
    std::multimap<std::string, std::string> parents;
    ForEachDatabaseLine("subclasses", [&](size_t, std::string_view line) {
        size_t space = line.find(' ');
        if (space == std::string_view::npos || space == 0 || space + 1 == line.size())
            return;
        parents.emplace(LowerASCII(line.substr(0, space)), LowerASCII(line.substr(space + 1)));
    });
    return parents;
}

/// The implicit parents that every type has besides those listed.
void AddImplicitParents(const std::string& type, std::vector<std::string>& pending) {
    if (type.compare(0, 5, "text/") == 0 && type != "text/plain")
        pending.push_back("text/plain");
    if (type.compare(0, 6, "inode/") != 0 && type != "application/octet-stream")
        pending.push_back("application/octet-stream");
}

} // namespace

CFStringRef CFCopyTypeIdentifierForFileName(std::string_view name) {
    if (name.empty() || name.find('/') != std::string_view::npos ||
        name.find('\0') != std::string_view::npos)
        return nullptr;
    std::string exactName(name);
    std::string lowerName = LowerASCII(name);

    const Glob* best = nullptr;
    auto better = [](const Glob& a, const Glob& b) {
        bool aLiteral = !HasWildcard(a.pattern), bLiteral = !HasWildcard(b.pattern);
        if (aLiteral != bLiteral)
            return aLiteral;
        if (a.weight != b.weight)
            return a.weight > b.weight;
        return a.pattern.size() > b.pattern.size();
    };
    std::vector<Glob> globs = ReadGlobs();
    for (const Glob& glob : globs)
        if (Matches(glob, exactName, lowerName) && (!best || better(glob, *best)))
            best = &glob;
    if (!best)
        return nullptr;
    return CFStringCreateWithBytes(kCFAllocatorDefault,
                                   reinterpret_cast<const UInt8*>(best->type.data()),
                                   CFIndex(best->type.size()), kCFStringEncodingUTF8, false);
}

Boolean UTTypeConformsTo(CFStringRef type, CFStringRef conformsTo) {
    std::string from, to;
    if (!CFString::GetUTF8(type, from) || !CFString::GetUTF8(conformsTo, to))
        return false;
    from = LowerASCII(from);
    to = LowerASCII(to);
    if (from == to)
        return true;

    std::multimap<std::string, std::string> parents = ReadParents();
    std::set<std::string> seen{from};
    std::vector<std::string> pending{from};
    while (!pending.empty()) {
        std::string current = std::move(pending.back());
        pending.pop_back();
        std::vector<std::string> next;
        auto [first, last] = parents.equal_range(current);
        for (auto it = first; it != last; ++it)
            next.push_back(it->second);
        AddImplicitParents(current, next);
        for (std::string& parent : next) {
            if (parent == to)
                return true;
            if (seen.insert(parent).second) // a cycle in the database ends here
                pending.push_back(std::move(parent));
        }
    }
    return false;
}
