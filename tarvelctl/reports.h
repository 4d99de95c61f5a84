// The reports that netstat selects among, as they run without options of their own. Their settings are in
// netstat_options. Each returns 0, or the error number of a fetch, which has said why on standard error.

#ifndef TARVELCTL_TARVELCTL_REPORTS_H
#define TARVELCTL_TARVELCTL_REPORTS_H

int list_flows();
int list_flow_advisories();
int list_flow_owners();
int list_interfaces();
int list_flow_switches();
int cmd_userstack();

// The option -n of the flow and route listings, taken from the arguments of a command with these short
// options. Any other option is passed over; the option parser has reported it.
void take_numerical_option(int argc, char **argv, const char *letters);

#endif
