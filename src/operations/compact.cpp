// Compacting lives here.
