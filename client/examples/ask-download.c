/* Asks the font agent whether fonts may be downloaded and prints its answer.
 *
 *   ask-download [--suppress] POSTSCRIPT-NAME...
 *
 * Prints "result R suppress S" and exits 0, or prints the error and exits 1. */
#include <glyphwell/client.h>
#include <stdio.h>
#include <string.h>

int main(int argc, char** argv) {
    glyphwell_request* request = glyphwell_request_new(GLYPHWELL_ASK_DOWNLOAD);
    glyphwell_request_set_application_name(request, "ask-download example");
    for (int i = 1; i < argc; ++i) {
        if (strcmp(argv[i], "--suppress") == 0)
            glyphwell_request_set_suppress(request, 1);
        else
            glyphwell_request_add_font(request, argv[i], NULL);
    }
    glyphwell_reply* reply = NULL;
    int status = glyphwell_request_send(request, NULL, 60000, &reply);
    glyphwell_request_free(request);
    if (status != GLYPHWELL_OK) {
        fprintf(stderr, "ask-download: %s\n", glyphwell_status_text(status));
        return 1;
    }
    printf("result %d suppress %d\n", glyphwell_reply_get_result(reply),
           glyphwell_reply_get_suppress(reply));
    glyphwell_reply_free(reply);
    return 0;
}
