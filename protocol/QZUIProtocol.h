// The agent's wire contract, shared by the agent, the glyphwell tool and the client library:
// the port name, the message ids, the request and reply keys, and the number type of the yes/no
// answers. Qt-free.
//
// Each key's text is its own name without the leading "k" ("QZUIPropertyFontName"). The keys
// are created once, at first use of this library, and live for the whole process.
#pragma once

#include "platform/CFNumber.h"
#include "platform/CFString.h"

/// The agent's port name; its last two components are fixed, the domain is ours.
#define QZ_UI_AGENT_PORT_NAME "org.glyphwell.Glyphwell.GlyphwellUIAgent"
/// The port name as text, for callers that build paths or print it.
inline constexpr char kQZUIAgentPortNameText[] = QZ_UI_AGENT_PORT_NAME;
/// The port name as a string value.
extern const CFStringRef kQZUIAgentPortName;

/// The message ids a client sends; any other id is answered with an empty reply.
enum QZUIMessageID : SInt32 {
    /// May an application use a font that is not installed but was found in font files on disk?
    kQZUIMessageAutoActivation = 1,
    /// May fonts be downloaded? Downloads them after consent.
    kQZUIMessageFontDownload = 2,
};

/// Yes/no answers travel as numbers of this type holding 1 or 0, never as booleans.
inline constexpr CFNumberType kQZUIReplyNumberType = kCFNumberCharType;

// Request keys.
extern const CFStringRef kQZUIPropertyApplicationName;
extern const CFStringRef kQZUIPropertyProcessID;
extern const CFStringRef kQZUIPropertyBundleURL;
extern const CFStringRef kQZUIPropertyFontName;
extern const CFStringRef kQZUIPropertyRequestDictionary;
extern const CFStringRef kQZUIPropertyFontProperties;
// Request (message id 1) and reply keys.
extern const CFStringRef kQZUIPropertyCandidateFontURLs;
extern const CFStringRef kQZUIPropertySuppress;
// Reply key.
extern const CFStringRef kQZUIPropertyResult;

// Font attribute keys of the dictionaries in kQZUIPropertyFontProperties.
extern const CFStringRef NSFontNameAttribute;
extern const CFStringRef NSFontFamilyAttribute;
extern const CFStringRef NSFontVisibleNameAttribute;
extern const CFStringRef NSCTFontLocalizedFamilyNameAttribute;
