// Type identifiers of files and their conformance, after the freedesktop shared MIME-info
// database: a file's type identifier is a MIME type ("font/ttf"), found from its name by the
// "globs2" files, and one type conforms to another when it is the same type or reaches it through
// the "subclasses" files ("font/otf" conforms to "font/ttf" when "font/otf font/ttf" is listed).
//
// The database is read from "mime/" under each XDG data directory (GetDataDirectories, most
// important first) on every call; nothing is cached, so a changed environment or database takes
// effect at once. Unreadable files count as empty. Only names are looked at, never contents.
#pragma once

#include <string_view>

#include "platform/CFString.h"

/// A new string with the MIME type whose glob patterns match the file name `name` (a single
/// component, UTF-8, no "/"), or null when none matches. Literal patterns ("Makefile") win over
/// wildcard ones; among the others the highest weight wins, then the longest pattern. Patterns
/// without the "cs" flag match case-insensitively (ASCII letters). A type listed in a more
/// important directory takes no patterns from less important ones ("__NOGLOBS__" lists a type
/// with none). Returns a new reference; the caller releases it.
CFStringRef CFCopyTypeIdentifierForFileName(std::string_view name);

/// True when the MIME type `type` conforms to `conformsTo`: they are equal (ASCII case
/// ignored), or `conformsTo` is reached from `type` through the parents that the "subclasses"
/// files list, or through the two implicit parents of the MIME-info scheme: every "text/*" type
/// is a kind of "text/plain", and every type outside "inode/*" a kind of
/// "application/octet-stream". False when either is null.
Boolean UTTypeConformsTo(CFStringRef type, CFStringRef conformsTo);
