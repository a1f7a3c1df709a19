<?xml version="1.0" encoding="utf-8"?>
<!DOCTYPE TS>
<TS version="2.1" language="zh_CN" sourcelanguage="en_US">
<context>
    <name>Localized</name>
    <message>
        <source>QZ_HEADLINE_FONT</source>
        <extracomment>Headline of the font-use alert. %1: application name, %2: font name.</extracomment>
        <translation>“%1”想要使用未安装的字体“%2”。</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_FONT_VOLUME</source>
        <extracomment>Headline of the font-use alert when the font file lies on another volume. %1: application name, %2: font name, %3: volume name.</extracomment>
        <translation>“%1”想要使用未安装的字体“%2”，该字体位于卷“%3”上。</translation>
    </message>
    <message>
        <source>QZ_DETAIL_FONT_NOT_INSTALLED</source>
        <extracomment>Detail text of the font-use alert.</extracomment>
        <translation>该字体尚未安装，但已找到包含该字体的字体文件。如果允许，该应用程序即可使用此字体。</translation>
    </message>
    <message>
        <source>QZ_BUTTON_ALLOW</source>
        <extracomment>Button: let the application use the font.</extracomment>
        <translation>允许</translation>
    </message>
    <message>
        <source>QZ_BUTTON_DISALLOW</source>
        <extracomment>Button: do not let the application use the font.</extracomment>
        <translation>不允许</translation>
    </message>
    <message>
        <source>QZ_BUTTON_SHOW_IN_FINDER</source>
        <extracomment>Button: show the font files in the file manager; the question stays.</extracomment>
        <translation>在文件管理器中显示</translation>
    </message>
    <message>
        <source>QZ_DO_NOT_WARN_APPLICATION</source>
        <extracomment>Checkbox of the font-use alert. %1: application name.</extracomment>
        <translation>不再针对“%1”询问</translation>
    </message>
    <message>
        <source>QZ_AUTO_ACTIVATION_HELP_ANCHOR</source>
        <extracomment>Not shown: the anchor of the help page section opened by the alert's help button. Keep it as it is.</extracomment>
        <translation>auto-activation</translation>
    </message>
    <message>
        <source>QZ_CURRENT_APPLICATION</source>
        <extracomment>Stands for the application name when none is known; used inside the other texts.</extracomment>
        <translation>当前应用程序</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_NEEDS_TO_DOWNLOAD_FONT_NAME</source>
        <extracomment>Headline of the download alert for one font. %1: application name, %2: font name.</extracomment>
        <translation>“%1”需要下载字体“%2”。</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_NEEDS_TO_DOWNLOAD</source>
        <extracomment>Headline of the download alert for several fonts. %1: application name.</extracomment>
        <translation>“%1”需要下载字体。</translation>
    </message>
    <message>
        <source>QZ_DETAIL_FONT_SIZE</source>
        <extracomment>Detail text of the download alert for one font. %1: font name, %2: size (such as 12.3 MB).</extracomment>
        <translation>字体“%1”的大小为 %2。要下载吗？</translation>
    </message>
    <message>
        <source>QZ_DETAIL_DOWNLOAD_SIZE</source>
        <extracomment>Detail text of the download alert for several fonts. %1: total size (such as 12.3 MB).</extracomment>
        <translation>下载总大小为 %1。要下载这些字体吗？</translation>
    </message>
    <message>
        <source>Skip</source>
        <extracomment>Button of the download alert: do not download.</extracomment>
        <translation>跳过</translation>
    </message>
    <message>
        <source>Download</source>
        <extracomment>Button of the download alert: download the fonts.</extracomment>
        <translation>下载</translation>
    </message>
    <message>
        <source>QZ_PREPARING_TO_DOWNLOAD</source>
        <extracomment>Status line of the download window before the first font.</extracomment>
        <translation>正在准备下载…</translation>
    </message>
    <message>
        <source>QZ_PREPARING_TO_DOWNLOAD_FONT</source>
        <extracomment>Status line of the download window. %1: font name.</extracomment>
        <translation>正在准备下载“%1”…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOADING_FONT</source>
        <extracomment>Status line of the download window. %1: font name.</extracomment>
        <translation>正在下载“%1”…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOADING_FONTS</source>
        <extracomment>Status line of the download window when the font being downloaded has no name.</extracomment>
        <translation>正在下载字体…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_WINDOW_TITLE</source>
        <extracomment>Title of the download window.</extracomment>
        <translation>字体下载</translation>
    </message>
    <message>
        <source>%1$@ of %2$@</source>
        <extracomment>Size line of the download window. %1: size downloaded so far, %2: total size.</extracomment>
        <translation>%1 / %2</translation>
    </message>
    <message>
        <source>Continue Download</source>
        <extracomment>Button: go on with the download after an error or while offline.</extracomment>
        <translation>继续下载</translation>
    </message>
    <message>
        <source>Cancel</source>
        <extracomment>Button: stop the download.</extracomment>
        <translation>取消</translation>
    </message>
    <message>
        <source>Network is not connected.</source>
        <extracomment>Headline of the offline alert.</extracomment>
        <translation>网络未连接。</translation>
    </message>
    <message>
        <source>You are not connected to the Internet. Do you want to cancel downloading?</source>
        <extracomment>Detail text of the offline alert; its default button is Cancel.</extracomment>
        <translation>您尚未连接到互联网。要取消下载吗？</translation>
    </message>
    <message>
        <source>This question closes without an answer in %@.</source>
        <extracomment>Countdown under the font-use alert. %1: the time left, such as 1:59.</extracomment>
        <translation>此询问将在 %1 后自动关闭且不作答复。</translation>
    </message>
    <message>
        <source>Help</source>
        <extracomment>Title of the help window of the font-use alert.</extracomment>
        <translation>帮助</translation>
    </message>
    <message>
        <source>QZ_AUTO_ACTIVATION_TITLE</source>
        <extracomment>Title of the alert that asks whether an application may use a font.</extracomment>
        <translation>使用字体？</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_CONFIRMATION_TITLE</source>
        <extracomment>Title of the alert that asks whether fonts may be downloaded.</extracomment>
        <translation>下载字体？</translation>
    </message>
    <message>
        <source>QZ_NETWORK_ALERT_TITLE</source>
        <extracomment>Title of the alert shown when the network is not connected.</extracomment>
        <translation>无网络连接</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_ERROR_TITLE</source>
        <extracomment>Title of the alert shown when a font download failed.</extracomment>
        <translation>字体下载失败</translation>
    </message>
    <message>
        <source>QZ_ERROR_DOMAIN_CODE</source>
        <extracomment>Headline of the download failure alert when the failure has no description: %1 is the error domain, %2 the error code.</extracomment>
        <translation>%1 错误 %2。</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_PROGRESS_NAME</source>
        <extracomment>Accessible name of the download window's progress bar.</extracomment>
        <translation>下载进度</translation>
    </message>
</context>
<context>
    <name>QZFontService</name>
    <message>
        <source>The font “%1” cannot be downloaded.</source>
        <extracomment>Download failure alert. Headline of the download failure alert. %1: the font's PostScript name.</extracomment>
        <translation>无法下载字体“%1”。</translation>
    </message>
    <message>
        <source>No downloadable font has this name.</source>
        <extracomment>Download failure alert. Reason: no catalog offers the font.</extracomment>
        <translation>没有使用此名称的可下载字体。</translation>
    </message>
    <message>
        <source>The downloaded font file does not hold this font.</source>
        <extracomment>Download failure alert. Reason: the asset was installed but does not contain the requested font.</extracomment>
        <translation>下载的字体文件不包含此字体。</translation>
    </message>
</context>
<context>
    <name>QZFontDownloader</name>
    <message>
        <source>The server offers %1 bytes, but the font should have %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes the server announces, %2: bytes expected.</extracomment>
        <translation>服务器提供 %1 字节，但该字体应为 %2 字节。</translation>
    </message>
    <message>
        <source>The server sent more than the %1 bytes of the font.</source>
        <extracomment>Download failure alert. Reason. %1: bytes expected.</extracomment>
        <translation>服务器发送的数据超过了字体的 %1 字节。</translation>
    </message>
    <message>
        <source>The font file cannot be written: %1</source>
        <extracomment>Download failure alert. Reason. %1: the system's error text.</extracomment>
        <translation>无法写入字体文件：%1</translation>
    </message>
    <message>
        <source>The server answered with the HTTP status %1.</source>
        <extracomment>Download failure alert. Reason. %1: HTTP status code.</extracomment>
        <translation>服务器返回了 HTTP 状态 %1。</translation>
    </message>
    <message>
        <source>Fonts are downloaded only from https, http and file addresses, and redirected only to https and http ones.</source>
        <extracomment>Download failure alert. Reason: the catalog's address or a redirection uses another scheme.</extracomment>
        <translation>字体只能从 https、http 和 file 地址下载，并且只能重定向到 https 和 http 地址。</translation>
    </message>
    <message>
        <source>The connection ended after %1 of %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes received, %2: bytes expected.</extracomment>
        <translation>连接在收到 %1 字节（共 %2 字节）后中断。</translation>
    </message>
    <message>
        <source>The download failed: %1</source>
        <extracomment>Download failure alert. Reason. %1: the transfer library's error text.</extracomment>
        <translation>下载失败：%1</translation>
    </message>
    <message>
        <source>The font folder cannot be created: %1</source>
        <extracomment>Download failure alert. Reason. %1: the system's error text.</extracomment>
        <translation>无法创建字体文件夹：%1</translation>
    </message>
    <message>
        <source>The download holds %1 bytes, but the font should have %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes received, %2: bytes expected.</extracomment>
        <translation>下载的数据为 %1 字节，但该字体应为 %2 字节。</translation>
    </message>
    <message>
        <source>The downloaded file is damaged: its SHA-256 checksum is not the expected one.</source>
        <extracomment>Download failure alert. Reason: checksum mismatch.</extracomment>
        <translation>下载的文件已损坏：其 SHA-256 校验和与预期不符。</translation>
    </message>
    <message>
        <source>The downloaded file is not a font.</source>
        <extracomment>Download failure alert. Reason.</extracomment>
        <translation>下载的文件不是字体。</translation>
    </message>
    <message>
        <source>The server did not answer within %1 seconds.</source>
        <extracomment>Download failure alert. Reason. %1: seconds waited.</extracomment>
        <translation>服务器未在 %1 秒内响应。</translation>
    </message>
    <message>
        <source>The downloaded file does not hold the font “%1”.</source>
        <extracomment>Download failure alert. Reason. %1: the font's PostScript name.</extracomment>
        <translation>下载的文件不包含字体“%1”。</translation>
    </message>
    <message>
        <source>The download was given up: the server sent less than %1 bytes per second over %2 seconds.</source>
        <extracomment>Download failure alert. Reason. %1: bytes per second, %2: seconds measured.</extracomment>
        <translation>已放弃下载：服务器在 %2 秒内的发送速度低于每秒 %1 字节。</translation>
    </message>
</context>
</TS>
