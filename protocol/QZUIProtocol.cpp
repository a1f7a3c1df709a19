#include "protocol/QZUIProtocol.h"

const CFStringRef kQZUIAgentPortName = CFSTR(QZ_UI_AGENT_PORT_NAME);

#define QZ_KEY(name) const CFStringRef k##name = CFSTR(#name)
QZ_KEY(QZUIPropertyApplicationName);
QZ_KEY(QZUIPropertyProcessID);
QZ_KEY(QZUIPropertyBundleURL);
QZ_KEY(QZUIPropertyFontName);
QZ_KEY(QZUIPropertyRequestDictionary);
QZ_KEY(QZUIPropertyFontProperties);
QZ_KEY(QZUIPropertyCandidateFontURLs);
QZ_KEY(QZUIPropertySuppress);
QZ_KEY(QZUIPropertyResult);
#undef QZ_KEY

#define NS_KEY(name) const CFStringRef name = CFSTR(#name)
NS_KEY(NSFontNameAttribute);
NS_KEY(NSFontFamilyAttribute);
NS_KEY(NSFontVisibleNameAttribute);
NS_KEY(NSCTFontLocalizedFamilyNameAttribute);
#undef NS_KEY
