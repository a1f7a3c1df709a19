// The request and reply keys shared with the font registry's clients: each constant's text is its
// own name without the leading "k". And the font attribute keys read from requests.
#pragma once

#include "platform/CFString.h"

#define kQZUIPropertyApplicationName CFSTR("QZUIPropertyApplicationName")
#define kQZUIPropertyProcessID CFSTR("QZUIPropertyProcessID")
#define kQZUIPropertyBundleURL CFSTR("QZUIPropertyBundleURL")
#define kQZUIPropertyFontName CFSTR("QZUIPropertyFontName")
#define kQZUIPropertyRequestDictionary CFSTR("QZUIPropertyRequestDictionary")
#define kQZUIPropertyCandidateFontURLs CFSTR("QZUIPropertyCandidateFontURLs")
#define kQZUIPropertyFontProperties CFSTR("QZUIPropertyFontProperties")
#define kQZUIPropertySuppress CFSTR("QZUIPropertySuppress")
#define kQZUIPropertyResult CFSTR("QZUIPropertyResult")

#define NSFontNameAttribute CFSTR("NSFontNameAttribute")
#define NSFontFamilyAttribute CFSTR("NSFontFamilyAttribute")
#define NSFontVisibleNameAttribute CFSTR("NSFontVisibleNameAttribute")
#define NSCTFontLocalizedFamilyNameAttribute CFSTR("NSCTFontLocalizedFamilyNameAttribute")

/// The agent's port name; its last two components are fixed, the domain is ours.
#define kQZUIAgentPortName "org.glyphwell.Glyphwell.GlyphwellUIAgent"
