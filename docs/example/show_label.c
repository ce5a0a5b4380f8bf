/*
 * show_label: print the label of each FILE and whether this process may
 * read it.
 *
 *   cc -std=c11 show_label.c $(pkg-config --cflags --libs vyr) -o show_label
 *   ./show_label FILE...
 *
 * With -s LABEL the decision is made for LABEL (label text) instead of the
 * label of this process.
 */
#include <vyr.h>

#include <errno.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

/* Label text with level and category names; numbers when the databases
 * can't name them.  The caller frees the string. */
static char *text_of(const vyrl_t *label)
{
	char *text = vyrl_get_text(label, 0);
	return text != NULL ? text : vyrl_get_text(label, VYR_TEXT_NUMERIC);
}

/* The subject: label text given with -s, else this process's label. */
static vyrl_t *subject_label(int *argc, char ***argv)
{
	if (*argc > 2 && strcmp((*argv)[1], "-s") == 0) {
		vyrl_t *l = vyrl_get_from_text((*argv)[2]);
		if (l == NULL)
			fprintf(stderr, "show_label: %s: invalid label text\n", (*argv)[2]);
		*argc -= 2;
		*argv += 2;
		return l;
	}
	vyrl_t *l = vyr_get_pid(getpid());
	if (l == NULL)
		fprintf(stderr, "show_label: own label: %s\n", strerror(errno));
	return l;
}

int main(int argc, char **argv)
{
	vyrl_t *subject = subject_label(&argc, &argv);
	if (subject == NULL)
		return 1;
	if (argc < 2) {
		fprintf(stderr, "usage: show_label [-s LABEL] FILE...\n");
		vyrl_put(subject);
		return 2;
	}

	int status = 0;
	for (int i = 1; i < argc; ++i) {
		vyrl_t *file = vyr_get_path(argv[i]);
		if (file == NULL) {
			fprintf(stderr, "show_label: %s: %s\n", argv[i], strerror(errno));
			status = 1;
			continue;
		}
		char *text = text_of(file);
		/* The mandatory decision: 0 permitted, -1 denied. */
		const int readable = vyrl_permission(subject, file, VYR_REQ_READ) == 0;
		printf("%s\t%s\t%s\n", argv[i], text != NULL ? text : "?",
		       readable ? "readable" : "not readable");
		free(text);
		vyrl_put(file); /* every label handed out holds one reference */
	}
	vyrl_put(subject);
	return status;
}
