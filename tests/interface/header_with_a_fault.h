/* Uses a type without including the header that declares it. */
TAVO_Status tavo_fault(void);
