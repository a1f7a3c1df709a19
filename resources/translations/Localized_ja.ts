<?xml version="1.0" encoding="utf-8"?>
<!DOCTYPE TS>
<TS version="2.1" language="ja_JP" sourcelanguage="en_US">
<context>
    <name>Localized</name>
    <message>
        <source>QZ_HEADLINE_FONT</source>
        <extracomment>Headline of the font-use alert. %1: application name, %2: font name.</extracomment>
        <translation>%1 が、インストールされていないフォント「%2」を使用しようとしています。</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_FONT_VOLUME</source>
        <extracomment>Headline of the font-use alert when the font file lies on another volume. %1: application name, %2: font name, %3: volume name.</extracomment>
        <translation>%1 が、インストールされていないフォント「%2」を使用しようとしています。このフォントはボリューム「%3」で見つかりました。</translation>
    </message>
    <message>
        <source>QZ_DETAIL_FONT_NOT_INSTALLED</source>
        <extracomment>Detail text of the font-use alert.</extracomment>
        <translation>このフォントはインストールされていませんが、このフォントを含むフォントファイルが見つかりました。許可すると、アプリケーションはこのフォントを使用できます。</translation>
    </message>
    <message>
        <source>QZ_BUTTON_ALLOW</source>
        <extracomment>Button: let the application use the font.</extracomment>
        <translation>許可</translation>
    </message>
    <message>
        <source>QZ_BUTTON_DISALLOW</source>
        <extracomment>Button: do not let the application use the font.</extracomment>
        <translation>許可しない</translation>
    </message>
    <message>
        <source>QZ_BUTTON_SHOW_IN_FINDER</source>
        <extracomment>Button: show the font files in the file manager; the question stays.</extracomment>
        <translation>ファイルマネージャで表示</translation>
    </message>
    <message>
        <source>QZ_DO_NOT_WARN_APPLICATION</source>
        <extracomment>Checkbox of the font-use alert. %1: application name.</extracomment>
        <translation>%1 について今後確認しない</translation>
    </message>
    <message>
        <source>QZ_AUTO_ACTIVATION_HELP_ANCHOR</source>
        <extracomment>Not shown: the anchor of the help page section opened by the alert's help button. Keep it as it is.</extracomment>
        <translation>auto-activation</translation>
    </message>
    <message>
        <source>QZ_CURRENT_APPLICATION</source>
        <extracomment>Stands for the application name when none is known; used inside the other texts.</extracomment>
        <translation>現在のアプリケーション</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_NEEDS_TO_DOWNLOAD_FONT_NAME</source>
        <extracomment>Headline of the download alert for one font. %1: application name, %2: font name.</extracomment>
        <translation>%1 はフォント「%2」をダウンロードする必要があります。</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_NEEDS_TO_DOWNLOAD</source>
        <extracomment>Headline of the download alert for several fonts. %1: application name.</extracomment>
        <translation>%1 はフォントをダウンロードする必要があります。</translation>
    </message>
    <message>
        <source>QZ_DETAIL_FONT_SIZE</source>
        <extracomment>Detail text of the download alert for one font. %1: font name, %2: size (such as 12.3 MB).</extracomment>
        <translation>フォント「%1」のサイズは %2 です。ダウンロードしますか？</translation>
    </message>
    <message>
        <source>QZ_DETAIL_DOWNLOAD_SIZE</source>
        <extracomment>Detail text of the download alert for several fonts. %1: total size (such as 12.3 MB).</extracomment>
        <translation>ダウンロードの合計サイズは %1 です。フォントをダウンロードしますか？</translation>
    </message>
    <message>
        <source>Skip</source>
        <extracomment>Button of the download alert: do not download.</extracomment>
        <translation>スキップ</translation>
    </message>
    <message>
        <source>Download</source>
        <extracomment>Button of the download alert: download the fonts.</extracomment>
        <translation>ダウンロード</translation>
    </message>
    <message>
        <source>QZ_PREPARING_TO_DOWNLOAD</source>
        <extracomment>Status line of the download window before the first font.</extracomment>
        <translation>ダウンロードを準備中…</translation>
    </message>
    <message>
        <source>QZ_PREPARING_TO_DOWNLOAD_FONT</source>
        <extracomment>Status line of the download window. %1: font name.</extracomment>
        <translation>「%1」のダウンロードを準備中…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOADING_FONT</source>
        <extracomment>Status line of the download window. %1: font name.</extracomment>
        <translation>「%1」をダウンロード中…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOADING_FONTS</source>
        <extracomment>Status line of the download window when the font being downloaded has no name.</extracomment>
        <translation>フォントをダウンロード中…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_WINDOW_TITLE</source>
        <extracomment>Title of the download window.</extracomment>
        <translation>フォントのダウンロード</translation>
    </message>
    <message>
        <source>%1$@ of %2$@</source>
        <extracomment>Size line of the download window. %1: size downloaded so far, %2: total size.</extracomment>
        <translation>%2 中 %1</translation>
    </message>
    <message>
        <source>Continue Download</source>
        <extracomment>Button: go on with the download after an error or while offline.</extracomment>
        <translation>ダウンロードを続ける</translation>
    </message>
    <message>
        <source>Cancel</source>
        <extracomment>Button: stop the download.</extracomment>
        <translation>キャンセル</translation>
    </message>
    <message>
        <source>Network is not connected.</source>
        <extracomment>Headline of the offline alert.</extracomment>
        <translation>ネットワークに接続されていません。</translation>
    </message>
    <message>
        <source>You are not connected to the Internet. Do you want to cancel downloading?</source>
        <extracomment>Detail text of the offline alert; its default button is Cancel.</extracomment>
        <translation>インターネットに接続されていません。ダウンロードをキャンセルしますか？</translation>
    </message>
    <message>
        <source>This question closes without an answer in %@.</source>
        <extracomment>Countdown under the font-use alert. %1: the time left, such as 1:59.</extracomment>
        <translation>この確認は %1 後に応答なしで閉じられます。</translation>
    </message>
    <message>
        <source>Help</source>
        <extracomment>Title of the help window of the font-use alert.</extracomment>
        <translation>ヘルプ</translation>
    </message>
    <message>
        <source>QZ_AUTO_ACTIVATION_TITLE</source>
        <extracomment>Title of the alert that asks whether an application may use a font.</extracomment>
        <translation>フォントを使用しますか？</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_CONFIRMATION_TITLE</source>
        <extracomment>Title of the alert that asks whether fonts may be downloaded.</extracomment>
        <translation>フォントをダウンロードしますか？</translation>
    </message>
    <message>
        <source>QZ_NETWORK_ALERT_TITLE</source>
        <extracomment>Title of the alert shown when the network is not connected.</extracomment>
        <translation>ネットワークに接続されていません</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_ERROR_TITLE</source>
        <extracomment>Title of the alert shown when a font download failed.</extracomment>
        <translation>フォントのダウンロードに失敗しました</translation>
    </message>
    <message>
        <source>QZ_ERROR_DOMAIN_CODE</source>
        <extracomment>Headline of the download failure alert when the failure has no description: %1 is the error domain, %2 the error code.</extracomment>
        <translation>%1 のエラー %2。</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_PROGRESS_NAME</source>
        <extracomment>Accessible name of the download window's progress bar.</extracomment>
        <translation>ダウンロードの進行状況</translation>
    </message>
</context>
<context>
    <name>QZFontService</name>
    <message>
        <source>The font “%1” cannot be downloaded.</source>
        <extracomment>Download failure alert. Headline of the download failure alert. %1: the font's PostScript name.</extracomment>
        <translation>フォント「%1」をダウンロードできません。</translation>
    </message>
    <message>
        <source>No downloadable font has this name.</source>
        <extracomment>Download failure alert. Reason: no catalog offers the font.</extracomment>
        <translation>この名前のダウンロード可能なフォントはありません。</translation>
    </message>
    <message>
        <source>The downloaded font file does not hold this font.</source>
        <extracomment>Download failure alert. Reason: the asset was installed but does not contain the requested font.</extracomment>
        <translation>ダウンロードしたフォントファイルにこのフォントが含まれていません。</translation>
    </message>
</context>
<context>
    <name>QZFontDownloader</name>
    <message>
        <source>The server offers %1 bytes, but the font should have %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes the server announces, %2: bytes expected.</extracomment>
        <translation>サーバが提供するのは %1 バイトですが、フォントは %2 バイトのはずです。</translation>
    </message>
    <message>
        <source>The server sent more than the %1 bytes of the font.</source>
        <extracomment>Download failure alert. Reason. %1: bytes expected.</extracomment>
        <translation>サーバがフォントの %1 バイトを超えるデータを送信しました。</translation>
    </message>
    <message>
        <source>The font file cannot be written: %1</source>
        <extracomment>Download failure alert. Reason. %1: the system's error text.</extracomment>
        <translation>フォントファイルを書き込めません: %1</translation>
    </message>
    <message>
        <source>The server answered with the HTTP status %1.</source>
        <extracomment>Download failure alert. Reason. %1: HTTP status code.</extracomment>
        <translation>サーバが HTTP ステータス %1 を返しました。</translation>
    </message>
    <message>
        <source>Fonts are downloaded only from https, http and file addresses, and redirected only to https and http ones.</source>
        <extracomment>Download failure alert. Reason: the catalog's address or a redirection uses another scheme.</extracomment>
        <translation>フォントは https、http、file のアドレスからのみダウンロードされ、リダイレクト先は https と http のアドレスに限られます。</translation>
    </message>
    <message>
        <source>The connection ended after %1 of %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes received, %2: bytes expected.</extracomment>
        <translation>%2 バイト中 %1 バイトを受信したところで接続が切れました。</translation>
    </message>
    <message>
        <source>The download failed: %1</source>
        <extracomment>Download failure alert. Reason. %1: the transfer library's error text.</extracomment>
        <translation>ダウンロードに失敗しました: %1</translation>
    </message>
    <message>
        <source>The font folder cannot be created: %1</source>
        <extracomment>Download failure alert. Reason. %1: the system's error text.</extracomment>
        <translation>フォントフォルダを作成できません: %1</translation>
    </message>
    <message>
        <source>The download holds %1 bytes, but the font should have %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes received, %2: bytes expected.</extracomment>
        <translation>ダウンロードしたデータは %1 バイトですが、フォントは %2 バイトのはずです。</translation>
    </message>
    <message>
        <source>The downloaded file is damaged: its SHA-256 checksum is not the expected one.</source>
        <extracomment>Download failure alert. Reason: checksum mismatch.</extracomment>
        <translation>ダウンロードしたファイルは破損しています: SHA-256 チェックサムが一致しません。</translation>
    </message>
    <message>
        <source>The downloaded file is not a font.</source>
        <extracomment>Download failure alert. Reason.</extracomment>
        <translation>ダウンロードしたファイルはフォントではありません。</translation>
    </message>
    <message>
        <source>The server did not answer within %1 seconds.</source>
        <extracomment>Download failure alert. Reason. %1: seconds waited.</extracomment>
        <translation>サーバが %1 秒以内に応答しませんでした。</translation>
    </message>
    <message>
        <source>The downloaded file does not hold the font “%1”.</source>
        <extracomment>Download failure alert. Reason. %1: the font's PostScript name.</extracomment>
        <translation>ダウンロードしたファイルにフォント「%1」が含まれていません。</translation>
    </message>
    <message>
        <source>The download was given up: the server sent less than %1 bytes per second over %2 seconds.</source>
        <extracomment>Download failure alert. Reason. %1: bytes per second, %2: seconds measured.</extracomment>
        <translation>ダウンロードを中止しました: サーバの送信速度が %2 秒間にわたり毎秒 %1 バイト未満でした。</translation>
    </message>
</context>
</TS>
