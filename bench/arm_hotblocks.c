/* A qemu TCG plugin (plugin API version 1, as in Debian 12's qemu 7.2) that
 * counts how often each translated block of an armhf program runs, and writes
 * "address instructions executions" per block to $HOT_OUT when the program
 * exits. scripts/arm-profile.sh turns that into instructions per function. */
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <stddef.h>
typedef uint64_t qemu_plugin_id_t;
struct qemu_plugin_tb;
typedef struct qemu_info_t qemu_info_t;
enum qemu_plugin_op { QEMU_PLUGIN_INLINE_ADD_U64 };
typedef void (*tb_trans_cb)(qemu_plugin_id_t, struct qemu_plugin_tb *);
typedef void (*udata_cb)(qemu_plugin_id_t, void *);
extern void qemu_plugin_register_vcpu_tb_trans_cb(qemu_plugin_id_t, tb_trans_cb);
extern size_t qemu_plugin_tb_n_insns(const struct qemu_plugin_tb *);
extern uint64_t qemu_plugin_tb_vaddr(const struct qemu_plugin_tb *);
extern void qemu_plugin_register_vcpu_tb_exec_inline(struct qemu_plugin_tb *, enum qemu_plugin_op, void *, uint64_t);
extern void qemu_plugin_register_atexit_cb(qemu_plugin_id_t, udata_cb, void *);
__attribute__((visibility("default"))) int qemu_plugin_version = 1;
struct rec { uint64_t vaddr; uint64_t n; uint64_t count; };
#define MAXR 2000000 /* translated blocks kept; a benchmark run needs far fewer */
static struct rec *recs;
static size_t nrec;
static void on_trans(qemu_plugin_id_t id, struct qemu_plugin_tb *tb) {
    (void)id;
    if (recs == NULL || nrec >= MAXR) return;
    struct rec *r = &recs[nrec++];
    r->vaddr = qemu_plugin_tb_vaddr(tb);
    r->n = qemu_plugin_tb_n_insns(tb);
    r->count = 0;
    qemu_plugin_register_vcpu_tb_exec_inline(tb, QEMU_PLUGIN_INLINE_ADD_U64, &r->count, 1);
}
static void on_exit_cb(qemu_plugin_id_t id, void *p) {
    (void)id; (void)p;
    const char *f = getenv("HOT_OUT");
    FILE *o = fopen(f ? f : "hotblocks.txt", "w");
    if (o == NULL) return;
    for (size_t i = 0; i < nrec; ++i)
        if (recs[i].count)
            fprintf(o, "%llx %llu %llu\n", (unsigned long long)recs[i].vaddr, (unsigned long long)recs[i].n,
                    (unsigned long long)recs[i].count);
    fclose(o);
}
__attribute__((visibility("default"))) int qemu_plugin_install(qemu_plugin_id_t id, const qemu_info_t *info, int argc, char **argv) {
    (void)info; (void)argc; (void)argv;
    recs = calloc(MAXR, sizeof *recs);
    qemu_plugin_register_vcpu_tb_trans_cb(id, on_trans);
    qemu_plugin_register_atexit_cb(id, on_exit_cb, NULL);
    return 0;
}
