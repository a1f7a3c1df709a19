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
        <source>QZ_DOWNLOAD_PROGRESS_NAME</source>
        <extracomment>Accessible name of the download window's progress bar.</extracomment>
        <translation>ダウンロードの進行状況</translation>
    </message>
</context>
</TS>
