/* A queue of records that carry their own links. */
#include <stddef.h>
#include <stdio.h>
#include <tavo_osal.h>

typedef struct Job {
    int number;
    TAVO_ListNode node;
} Job;

static Job* job_of(TAVO_ListNode* node) { return (Job*)(void*)((char*)node - offsetof(Job, node)); }

int main(void) {
    Job jobs[] = {{.number = 1}, {.number = 2}, {.number = 3}};
    TAVO_ListNode head;
    tavo_osal_init_list_head(&head);
    tavo_osal_add_to_queue(&jobs[0].node, &head);
    tavo_osal_add_to_queue(&jobs[1].node, &head);
    tavo_osal_list_add(&jobs[2].node, &head); /* at the front: served first */
    tavo_osal_list_delete(&jobs[0].node);
    while (!tavo_osal_is_list_empty(&head)) printf("job %d\n", job_of(tavo_osal_remove_from_queue(&head))->number);
    return 0;
}
