/* Files: the C library's streams. */
#include <stdio.h>
#include <tavo_osal.h>

static const char path[] = "/tmp/tavo-file-example.txt";

int main(void) {
    char line[32];
    FILE* file = tavo_osal_fopen(path, "w+");
    if (file == NULL) return 1;
    tavo_osal_fprintf(file, "width %d\n", 640);
    rewind(file);
    if (tavo_osal_fgets(line, sizeof line, file) != NULL) printf("read: %s", line);
    printf("another line: %s\n", tavo_osal_fgets(line, sizeof line, file) != NULL ? line : "none");
    /* Asking for the end also forgets it. */
    printf("at the end: %s", tavo_osal_feof(file) ? "yes" : "no");
    printf(", and asked again: %s\n", tavo_osal_feof(file) ? "yes" : "no");
    tavo_osal_fclose(file);
    printf("%lld bytes\n", (long long)tavo_osal_get_file_size(path));
    remove(path);
    printf("there: %d\n", tavo_osal_file_check_existence(path));
    return 0;
}
