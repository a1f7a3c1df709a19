<?xml version="1.0" encoding="utf-8"?>
<!DOCTYPE TS>
<TS version="2.1" language="en_US" sourcelanguage="en_US">
<context>
    <name>Localized</name>
    <message>
        <source>QZ_HEADLINE_FONT</source>
        <extracomment>Headline of the font-use alert. %1: application name, %2: font name.</extracomment>
        <translation>%1 wants to use the font “%2”, which is not installed.</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_FONT_VOLUME</source>
        <extracomment>Headline of the font-use alert when the font file lies on another volume. %1: application name, %2: font name, %3: volume name.</extracomment>
        <translation>%1 wants to use the font “%2”, which is not installed but was found on the volume “%3”.</translation>
    </message>
    <message>
        <source>QZ_DETAIL_FONT_NOT_INSTALLED</source>
        <extracomment>Detail text of the font-use alert.</extracomment>
        <translation>The font is not installed, but a font file that contains it was found. If you allow it, the application can use the font.</translation>
    </message>
    <message>
        <source>QZ_BUTTON_ALLOW</source>
        <extracomment>Button: let the application use the font.</extracomment>
        <translation>Allow</translation>
    </message>
    <message>
        <source>QZ_BUTTON_DISALLOW</source>
        <extracomment>Button: do not let the application use the font.</extracomment>
        <translation>Don’t Allow</translation>
    </message>
    <message>
        <source>QZ_BUTTON_SHOW_IN_FINDER</source>
        <extracomment>Button: show the font files in the file manager; the question stays.</extracomment>
        <translation>Show in File Manager</translation>
    </message>
    <message>
        <source>QZ_DO_NOT_WARN_APPLICATION</source>
        <extracomment>Checkbox of the font-use alert. %1: application name.</extracomment>
        <translation>Don’t ask again for %1</translation>
    </message>
    <message>
        <source>QZ_AUTO_ACTIVATION_HELP_ANCHOR</source>
        <extracomment>Not shown: the anchor of the help page section opened by the alert's help button. Keep it as it is.</extracomment>
        <translation>auto-activation</translation>
    </message>
    <message>
        <source>QZ_CURRENT_APPLICATION</source>
        <extracomment>Stands for the application name when none is known; used inside the other texts.</extracomment>
        <translation>The current application</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_NEEDS_TO_DOWNLOAD_FONT_NAME</source>
        <extracomment>Headline of the download alert for one font. %1: application name, %2: font name.</extracomment>
        <translation>%1 needs to download the font “%2”.</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_NEEDS_TO_DOWNLOAD</source>
        <extracomment>Headline of the download alert for several fonts. %1: application name.</extracomment>
        <translation>%1 needs to download fonts.</translation>
    </message>
    <message>
        <source>QZ_DETAIL_FONT_SIZE</source>
        <extracomment>Detail text of the download alert for one font. %1: font name, %2: size (such as 12.3 MB).</extracomment>
        <translation>The font “%1” is %2. Do you want to download it?</translation>
    </message>
    <message>
        <source>QZ_DETAIL_DOWNLOAD_SIZE</source>
        <extracomment>Detail text of the download alert for several fonts. %1: total size (such as 12.3 MB).</extracomment>
        <translation>The download is %1 in total. Do you want to download the fonts?</translation>
    </message>
    <message>
        <source>Skip</source>
        <extracomment>Button of the download alert: do not download.</extracomment>
        <translation>Skip</translation>
    </message>
    <message>
        <source>Download</source>
        <extracomment>Button of the download alert: download the fonts.</extracomment>
        <translation>Download</translation>
    </message>
    <message>
        <source>QZ_PREPARING_TO_DOWNLOAD</source>
        <extracomment>Status line of the download window before the first font.</extracomment>
        <translation>Preparing to download…</translation>
    </message>
    <message>
        <source>QZ_PREPARING_TO_DOWNLOAD_FONT</source>
        <extracomment>Status line of the download window. %1: font name.</extracomment>
        <translation>Preparing to download “%1”…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOADING_FONT</source>
        <extracomment>Status line of the download window. %1: font name.</extracomment>
        <translation>Downloading “%1”…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOADING_FONTS</source>
        <extracomment>Status line of the download window when the font being downloaded has no name.</extracomment>
        <translation>Downloading fonts…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_WINDOW_TITLE</source>
        <extracomment>Title of the download window.</extracomment>
        <translation>Font Download</translation>
    </message>
    <message>
        <source>%1$@ of %2$@</source>
        <extracomment>Size line of the download window. %1: size downloaded so far, %2: total size.</extracomment>
        <translation>%1 of %2</translation>
    </message>
    <message>
        <source>Continue Download</source>
        <extracomment>Button: go on with the download after an error or while offline.</extracomment>
        <translation>Continue Download</translation>
    </message>
    <message>
        <source>Cancel</source>
        <extracomment>Button: stop the download.</extracomment>
        <translation>Cancel</translation>
    </message>
    <message>
        <source>Network is not connected.</source>
        <extracomment>Headline of the offline alert.</extracomment>
        <translation>Network is not connected.</translation>
    </message>
    <message>
        <source>You are not connected to the Internet. Do you want to cancel downloading?</source>
        <extracomment>Detail text of the offline alert; its default button is Cancel.</extracomment>
        <translation>You are not connected to the Internet. Do you want to cancel downloading?</translation>
    </message>
    <message>
        <source>This question closes without an answer in %@.</source>
        <extracomment>Countdown under the font-use alert. %1: the time left, such as 1:59.</extracomment>
        <translation>This question closes without an answer in %1.</translation>
    </message>
    <message>
        <source>Help</source>
        <extracomment>Title of the help window of the font-use alert.</extracomment>
        <translation>Help</translation>
    </message>
    <message>
        <source>QZ_AUTO_ACTIVATION_TITLE</source>
        <extracomment>Title of the alert that asks whether an application may use a font.</extracomment>
        <translation>Use Font?</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_CONFIRMATION_TITLE</source>
        <extracomment>Title of the alert that asks whether fonts may be downloaded.</extracomment>
        <translation>Download Fonts?</translation>
    </message>
    <message>
        <source>QZ_NETWORK_ALERT_TITLE</source>
        <extracomment>Title of the alert shown when the network is not connected.</extracomment>
        <translation>No Network Connection</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_ERROR_TITLE</source>
        <extracomment>Title of the alert shown when a font download failed.</extracomment>
        <translation>Font Download Failed</translation>
    </message>
    <message>
        <source>QZ_ERROR_DOMAIN_CODE</source>
        <extracomment>Headline of the download failure alert when the failure has no description: %1 is the error domain, %2 the error code.</extracomment>
        <translation>%1 error %2.</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_PROGRESS_NAME</source>
        <extracomment>Accessible name of the download window's progress bar.</extracomment>
        <translation>Download progress</translation>
    </message>
</context>
<context>
    <name>QZFontService</name>
    <message>
        <source>The font “%1” cannot be downloaded.</source>
        <extracomment>Download failure alert. Headline of the download failure alert. %1: the font's PostScript name.</extracomment>
        <translation>The font “%1” cannot be downloaded.</translation>
    </message>
    <message>
        <source>No downloadable font has this name.</source>
        <extracomment>Download failure alert. Reason: no catalog offers the font.</extracomment>
        <translation>No downloadable font has this name.</translation>
    </message>
    <message>
        <source>The downloaded font file does not hold this font.</source>
        <extracomment>Download failure alert. Reason: the asset was installed but does not contain the requested font.</extracomment>
        <translation>The downloaded font file does not hold this font.</translation>
    </message>
</context>
<context>
    <name>QZFontDownloader</name>
    <message>
        <source>The server offers %1 bytes, but the font should have %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes the server announces, %2: bytes expected.</extracomment>
        <translation>The server offers %1 bytes, but the font should have %2 bytes.</translation>
    </message>
    <message>
        <source>The server sent more than the %1 bytes of the font.</source>
        <extracomment>Download failure alert. Reason. %1: bytes expected.</extracomment>
        <translation>The server sent more than the %1 bytes of the font.</translation>
    </message>
    <message>
        <source>The font file cannot be written: %1</source>
        <extracomment>Download failure alert. Reason. %1: the system's error text.</extracomment>
        <translation>The font file cannot be written: %1</translation>
    </message>
    <message>
        <source>The server answered with the HTTP status %1.</source>
        <extracomment>Download failure alert. Reason. %1: HTTP status code.</extracomment>
        <translation>The server answered with the HTTP status %1.</translation>
    </message>
    <message>
        <source>Fonts are downloaded only from https, http and file addresses, and redirected only to https and http ones.</source>
        <extracomment>Download failure alert. Reason: the catalog's address or a redirection uses another scheme.</extracomment>
        <translation>Fonts are downloaded only from https, http and file addresses, and redirected only to https and http ones.</translation>
    </message>
    <message>
        <source>The connection ended after %1 of %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes received, %2: bytes expected.</extracomment>
        <translation>The connection ended after %1 of %2 bytes.</translation>
    </message>
    <message>
        <source>The download failed: %1</source>
        <extracomment>Download failure alert. Reason. %1: the transfer library's error text.</extracomment>
        <translation>The download failed: %1</translation>
    </message>
    <message>
        <source>The font folder cannot be created: %1</source>
        <extracomment>Download failure alert. Reason. %1: the system's error text.</extracomment>
        <translation>The font folder cannot be created: %1</translation>
    </message>
    <message>
        <source>The download holds %1 bytes, but the font should have %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes received, %2: bytes expected.</extracomment>
        <translation>The download holds %1 bytes, but the font should have %2 bytes.</translation>
    </message>
    <message>
        <source>The downloaded file is damaged: its SHA-256 checksum is not the expected one.</source>
        <extracomment>Download failure alert. Reason: checksum mismatch.</extracomment>
        <translation>The downloaded file is damaged: its SHA-256 checksum is not the expected one.</translation>
    </message>
    <message>
        <source>The downloaded file is not a font.</source>
        <extracomment>Download failure alert. Reason.</extracomment>
        <translation>The downloaded file is not a font.</translation>
    </message>
    <message>
        <source>The server did not answer within %1 seconds.</source>
        <extracomment>Download failure alert. Reason. %1: seconds waited.</extracomment>
        <translation>The server did not answer within %1 seconds.</translation>
    </message>
    <message>
        <source>The downloaded file does not hold the font “%1”.</source>
        <extracomment>Download failure alert. Reason. %1: the font's PostScript name.</extracomment>
        <translation>The downloaded file does not hold the font “%1”.</translation>
    </message>
    <message>
        <source>The download was given up: the server sent less than %1 bytes per second over %2 seconds.</source>
        <extracomment>Download failure alert. Reason. %1: bytes per second, %2: seconds measured.</extracomment>
        <translation>The download was given up: the server sent less than %1 bytes per second over %2 seconds.</translation>
    </message>
</context>
</TS>
