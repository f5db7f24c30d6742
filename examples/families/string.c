/* Texts: null is refused, not read. */
#include <stdio.h>
#include <tavo_osal.h>

int main(void) {
    char text[32];
    long long number = 0;
    tavo_osal_string_copy(text, "Hello");
    tavo_osal_string_concatenate(text, ", World");
    printf("%s has %u characters\n", text, tavo_osal_string_get_length(text));
    printf("after the comma:%s\n", tavo_osal_string_search_character(text, ',') + 1);
    printf("the case does not matter: %d\n", tavo_osal_case_ignore_string_compare(text, "HELLO, WORLD"));
    char* upper = tavo_osal_convert_string_to_upper(text); /* ours to free */
    if (upper != NULL) printf("%s\n", upper);
    tavo_osal_mem_free(upper);
    if (tavo_osal_convert_string_to_num("0x2a", 16, &number) == TAVO_SUCCESS) printf("%lld\n", number);
    printf("no text, no length: %u\n", tavo_osal_string_get_length(NULL));
    return 0;
}
