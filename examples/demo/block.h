/* What the demo's producer and consumer have agreed on. */
#ifndef DEMO_BLOCK_H
#define DEMO_BLOCK_H

#define DEMO_BLOCK_KEY 9U
#define DEMO_BLOCK_SIZE (16U * 1024U * 1024U)
#define DEMO_SEMAPHORE_KEY 4660U
#define DEMO_RESULT_KEY "8"
#define DEMO_RESULT_SIZE 64U

#endif
