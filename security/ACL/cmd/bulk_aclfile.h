// The check of one ACL file, from finding it to writing its cache.
#ifndef QZ_BULK_ACLFILE_H
#define QZ_BULK_ACLFILE_H

enum : unsigned {
    ACLFCK_OPT_COMPILE = 1,
    ACLFCK_OPT_CONTINUE = 2,
    ACLFCK_OPT_VERBOSE = 4,
    ACLFCK_OPT_STREAM = 8,
    ACLFCK_OPT_HELP = 16,
};

// Checks the file and prints each failure on standard error; failures of lines are buffered unless it is a terminal.
// `username` may be null. The flags compile, continue and verbose have an effect. Returns the command's exit status.
int aclfck__bulk_aclfile(const char *aclfname, const char *username, unsigned flags);

// Placeholder for a check that does not hold the whole file in memory. Does nothing and returns 0.
int aclfck__stream_aclfile(const char *aclfname, const char *username);

// Reserves memory for printing an error when there is none left. Call it once, at the start.
void aclfck__keep_spare_memory();

// Prints the current error and an empty line, and flushes.
void aclfck__print_error();

#endif
